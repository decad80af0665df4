#!/usr/bin/env python3
"""Checks what the pages state about the project: links, headers, layers."""
import pathlib
import re
import sys
import unittest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
PAGES = sorted(ROOT.glob("*.md")) + sorted((ROOT / "docs").glob("*.md"))


def prose(page):
    """The page without its fenced blocks and code spans."""
    text = re.sub(r"^```.*?^```$", "", page.read_text(encoding="utf-8"), flags=re.S | re.M)
    return re.sub(r"`[^`\n]*`", lambda span: span.group().replace("](", "]-("), text)


def anchors(page):
    heads = re.findall(r"^#+ (.*)$", prose(page), re.M)
    return {re.sub(r"[^\w -]", "", head.lower()).replace(" ", "-") for head in heads}


class Pages(unittest.TestCase):
    def test_links_lead_somewhere(self):
        seen = 0
        for page in PAGES:
            for target in re.findall(r"\]\(([^)\s]+)\)", prose(page)):
                if re.match(r"[a-z]+:", target):
                    continue
                name, _, anchor = target.partition("#")
                file = (page.parent / name) if name else page
                with self.subTest(page=page.name, target=target):
                    self.assertTrue(file.exists())
                    if anchor:
                        self.assertIn(anchor, anchors(file))
                seen += 1
        self.assertGreater(seen, 20)

    def test_readme_lists_every_public_header(self):
        listed = set(re.findall(r"^\| `(kovabackup/[\w/]+\.h)`", (ROOT / "README.md").read_text(),
                                re.M))
        headers = {str(header.relative_to(ROOT / "include"))
                   for header in (ROOT / "include/kovabackup").rglob("*.h")}
        self.assertEqual(listed, headers)

    def test_readme_leads_to_every_page(self):
        reached, todo = set(), [ROOT / "README.md"]
        while todo:
            page = todo.pop()
            reached.add(page)
            for target in re.findall(r"\]\(([^)\s#]+\.md)", prose(page)):
                linked = (page.parent / target).resolve()
                if linked not in reached:
                    todo.append(linked)
        self.assertEqual(set(PAGES) - reached, set())

    def test_named_scripts_exist(self):
        for page in PAGES:
            for name in re.findall(r"\bscripts/([\w-]+)", page.read_text(encoding="utf-8")):
                if name == "package" and not (ROOT / "debian").exists():
                    continue  # a source tree without packaging
                with self.subTest(page=page.name, script=name):
                    self.assertTrue((ROOT / "scripts" / name).exists())

    def test_layer_table_is_what_lint_checks(self):
        table = re.search(r"^\| Folder \| May include \|\n\|.*\n((?:\|.*\n)+)",
                          (ROOT / "docs/architecture.md").read_text(), re.M).group(1)
        shown = {row.split("|")[1].strip(" `"): row.split("|")[2].strip()
                 for row in table.splitlines()}
        rows = [row.split("|") for row in (ROOT / "layers.txt").read_text().splitlines()
                if row and not row.startswith("#")]
        self.assertEqual(list(shown), [row[1].strip() for row in rows])
        for row in rows:
            with self.subTest(folder=row[1].strip()):
                listed = set(re.findall(r"`([\w/]+)`", shown[row[1].strip()]))
                if shown[row[1].strip()] == "everything":
                    listed = {"*"}
                self.assertEqual(listed, set(row[2].split()))

    def test_every_colour_of_a_picture_has_a_dark_one(self):
        pictures = sorted((ROOT / "docs").glob("*.svg"))
        self.assertGreater(len(pictures), 2)
        for picture in pictures:
            text = picture.read_text(encoding="utf-8")
            dark = re.search(r"@media\(prefers-color-scheme:dark\)\{.*", text).group()
            for kind, colour in set(re.findall(r'\b(fill|stroke)="(#\w+)"', text.replace(dark, ""))):
                with self.subTest(picture=picture.name, kind=kind, colour=colour):
                    self.assertIn(f'[{kind}="{colour}"]{{{kind}:', dark)

if __name__ == "__main__":
    sys.exit(unittest.main())
