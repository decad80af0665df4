#!/usr/bin/env python3
"""Generates the site and checks that it is complete and needs nothing from outside."""
import html.parser
import os
import pathlib
import re
import subprocess
import sys
import tempfile
import unittest
import urllib.parse

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
HEADERS = sorted([*ROOT.glob("include/kovabackup/**/*.h"),
                  *ROOT.glob("platform/include/kovaplatform/*.h")])
GUIDES = sorted(ROOT.glob("docs/*.md"))
DECLARED = re.compile(r"^ *(?:class|struct|enum class) (\w+) (?:\w+ )*[:{]"
                      r"|^ *(?!return|static_assert)[\w:<>]+ [\w:<>*& ]*?(?!operator)\b(\w+)\(", re.M)
MARKUP = re.compile(r"[@\\](?:par|code|endcode|addtogroup|ingroup)\b")
PRIVATE = re.compile(r"\w+Private\b|_VarsMapper\w*|IsUnsupportedOption|AreTextsBeforeTheLast"
                     r"|enable_if")


class Page(html.parser.HTMLParser):
    """The links, anchors, loaded files and text of a page."""

    def __init__(self, path):
        super().__init__()
        self.links, self.anchors, self.loaded, self.text = [], set(), [], ""
        self.hidden = 0
        self.feed(path.read_text(encoding="utf-8"))

    def handle_starttag(self, tag, attrs):
        attrs = dict(attrs)
        self.anchors.add(attrs.get("id"))
        self.hidden += tag in ("script", "style")
        if tag == "a" and attrs.get("href"):
            self.links.append(attrs["href"])
        if tag in ("img", "script", "iframe") and attrs.get("src"):
            self.loaded.append(attrs["src"])
        if tag == "link" and attrs.get("rel") == "stylesheet":
            self.loaded.append(attrs["href"])

    def handle_endtag(self, tag):
        self.hidden -= tag in ("script", "style")

    def handle_data(self, data):
        if not self.hidden:
            self.text += data


def reference(header):
    return f"reference/{header.stem}.html"


class Site(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.scratch = tempfile.TemporaryDirectory()
        cls.made = subprocess.run([ROOT / "scripts/docs", cls.scratch.name], capture_output=True,
                                  text=True)
        cls.html = pathlib.Path(cls.scratch.name) / "html"
        cls.pages = {str(path.relative_to(cls.html)): Page(path)
                     for path in sorted(cls.html.rglob("*.html"))}

    @classmethod
    def tearDownClass(cls):
        cls.scratch.cleanup()

    def resolves(self, page, link):
        parts = urllib.parse.urlsplit(link)
        path = urllib.parse.unquote(parts.path) or pathlib.Path(page).name
        target = os.path.normpath(os.path.join(os.path.dirname(page), path))
        if target not in self.pages:
            return (self.html / target).is_file() and not parts.fragment
        anchor = urllib.parse.unquote(parts.fragment)
        return not anchor or anchor in self.pages[target].anchors

    def shows(self, page, pattern):
        return re.search(pattern, self.pages[page].text)

    def test_it_is_made_without_a_warning(self):
        self.assertEqual(self.made.stderr, "")
        self.assertEqual(self.made.stdout, f"{self.html}/index.html\n")
        self.assertEqual(self.made.returncode, 0)

    def test_every_link_and_anchor_resolves(self):
        seen = 0
        for name, page in self.pages.items():
            for link in {link for link in page.links if not urllib.parse.urlsplit(link).scheme}:
                with self.subTest(page=name, link=link):
                    self.assertTrue(self.resolves(name, link))
                seen += 1
        self.assertGreater(seen, 1000)

    def test_nothing_is_loaded_from_the_network(self):
        for name, page in self.pages.items():
            for source in page.loaded:
                with self.subTest(page=name, source=source):
                    parts = urllib.parse.urlsplit(source)
                    self.assertEqual(parts.scheme + parts.netloc, "")
                    self.assertTrue(((self.html / name).parent / parts.path).is_file())
        for style in self.html.rglob("*.css"):
            with self.subTest(style=style.name):
                outside = re.search(r"(?:@import|url\()\s*[\"']?(?:https?:|/)", style.read_text())
                self.assertIsNone(outside)

    def test_scripts_run_without_a_server(self):
        for script in self.html.rglob("*.js"):
            with self.subTest(script=script.name):
                self.assertIsNone(re.search(r"^import\b", script.read_text(), re.M))

    def test_the_browsers_preference_selects_the_dark_colours(self):
        dark = re.search(r"prefers-color-scheme: dark\).*?--color-background-primary: #1",
                         (self.html / "index.html").read_text(), re.S)
        self.assertTrue(dark)

    def test_every_guide_has_a_page_that_the_start_page_lists(self):
        for guide in GUIDES:
            with self.subTest(guide=guide.name):
                self.assertIn(f"{guide.stem}.html", self.pages["index.html"].links)
                title = guide.read_text().split("\n")[0].strip("# ")
                self.assertTrue(self.shows(f"{guide.stem}.html", re.escape(title)))

    def test_every_header_has_a_page_with_its_essay(self):
        for header in HEADERS:
            with self.subTest(header=header.name):
                self.assertIn(reference(header), self.pages["index.html"].links)
                essay = re.search(r"@file\s+(?:\* )?((?:\S+ ){3}\S+)", header.read_text())
                words = essay.group(1)
                self.assertTrue(self.shows(reference(header), re.escape(words)))

    def test_every_public_class_and_function_is_on_the_page_of_its_header(self):
        seen = 0
        for header in HEADERS:
            names = DECLARED.findall(header.read_text())
            for name in sorted({first or second for first, second in names}):
                if PRIVATE.fullmatch(name) or name.startswith("_"):
                    continue
                with self.subTest(header=header.name, name=name):
                    self.assertTrue(self.shows(reference(header), rf"\b{name}\b"))
                seen += 1
        self.assertGreater(seen, 80)

    def test_headers_and_their_guides_link_to_each_other(self):
        for header in HEADERS:
            page = reference(header)
            with self.subTest(header=header.name):
                guide = re.search(r"Guide:\s*<a[^>]*href=\"\.\./([\w-]+\.html)\"",
                                  (self.html / page).read_text()).group(1)
                self.assertTrue(self.shows(guide, "Reference:"))
                self.assertIn(page, self.pages[guide].links)

    def test_names_in_a_guide_lead_to_their_declarations(self):
        links = self.pages["options.html"].links
        self.assertTrue(any(re.search(r"option_map\.html#\S*optSecret", link) for link in links))

    def test_members_of_namespaces_are_named_in_full(self):
        self.assertTrue(self.shows("reference/path_util.html", r"std::string Path::dirname\(const"))

    def test_no_private_name_is_shown(self):
        for name, page in self.pages.items():
            if name.startswith("reference/") or name == "genindex.html":
                with self.subTest(page=name):
                    self.assertIsNone(PRIVATE.search(page.text))

    def test_labels_become_lists_and_no_markup_is_left(self):
        options = (self.html / "reference/option_map.html").read_text()
        label = r"<dt><strong>Threads</strong></dt>\s*<dd><p>one thread per map"
        self.assertTrue(re.search(label, options))
        for name, page in self.pages.items():
            if name.startswith("reference/"):
                with self.subTest(page=name):
                    self.assertIsNone(MARKUP.search(page.text))

    def test_lists_in_prose_are_not_code(self):
        command = (self.html / "reference/command.html").read_text()
        self.assertTrue(re.search("<li><p>becomes the leader of its own process group", command))

    def test_columns_in_prose_become_tables(self):
        options = (self.html / "reference/option_map.html").read_text()
        row = r"<td><p>int, long long\s*</p></td>\s*<td><p>its decimal form"
        self.assertTrue(re.search(row, options))

    def test_a_word_that_means_several_things_is_not_a_link(self):
        links = self.pages["performance.html"].links  # "find" is the system's command there
        self.assertFalse([link for link in links if link.startswith("reference/session_store.html#")])

    def test_pictures_are_shown(self):
        self.assertIn("_images/run.svg", self.pages["index.html"].loaded)
        plots = [image for image in self.pages["performance.html"].loaded if image.endswith(".svg")]
        self.assertGreater(len(plots), 5)

    def test_the_search_knows_guides_declarations_and_manual_pages(self):
        index = (self.html / "searchindex.js").read_text()
        for word in ("optSecret", "TreeWalk", '"options"', '"manual/kovabackup.1"'):
            self.assertTrue(word in index, word)


if __name__ == "__main__":
    missing = subprocess.run([ROOT / "scripts/docs", "--missing"], stdout=subprocess.PIPE, text=True,
                             check=True).stdout.strip()
    if missing:
        print(f"skipped: no {missing}")
        sys.exit(77)
    unittest.main()
