#!/usr/bin/env python3
"""Writes the source of the site. Usage: pages.py PROJECT OUTPUT XML

The pages are those that site.toml lists. Guides are copied, and their links lead to pages of the
site; a link to a file that has no page becomes plain text. A header becomes a page that contains
its part of the reference, and a manual page is converted by scdoc and mandoc.
"""
import os
import pathlib
import re
import shutil
import subprocess
import sys
import tomllib

FENCED = re.compile(r"(^```.*?^```$)", re.S | re.M)
LINK = re.compile(r"`[^`\n]+`|(!?)\[([^\]]*)\]\(([^)\s]+)\)")
LINKS = "```{rst-class} page-links\n```\n"
INCLUDED = re.compile(r"^.*include/")  # what precedes the name by which programs include a header


def site_name(path):
    """The name of a project file's page, without its extension."""
    if path == "README.md":
        return "index"
    folder, stem = os.path.split(path.rpartition(".")[0])
    if path.endswith(".h"):
        return f"reference/{stem}"
    if path.endswith(".scd"):
        return f"manual/{stem}"
    return stem if folder else f"project/{stem.lower()}"


class Site:
    def __init__(self, project, output):
        self.project, self.output = project, output
        with open(project / "docs/site/site.toml", "rb") as file:
            plan = tomllib.load(file)
        self.groups, self.headers = plan["group"], plan["header"]
        self.pages = [path for group in self.groups for path in group["pages"]]
        self.files = {path: site_name(path) + ".md" for path in self.pages}
        self.files |= {f"docs/{image.name}": image.name for image in project.glob("docs/*.svg")}

    def write(self):
        for path in self.pages:
            target = self.output / self.files[path]
            target.parent.mkdir(parents=True, exist_ok=True)
            convert = {".h": self.header, ".scd": self.manual, ".md": self.guide}
            target.write_text(convert[pathlib.Path(path).suffix](path), encoding="utf-8")
        for image in self.project.glob("docs/*.svg"):
            shutil.copy(image, self.output)

    def link(self, path, target):
        """The link from one project file's page to another's."""
        return os.path.relpath(self.files[target], os.path.dirname(self.files[path]))

    def guide(self, path):
        text = (self.project / path).read_text(encoding="utf-8")
        text = re.sub(r"^<!--.*?-->\n*", "", text, flags=re.S | re.M)

        def moved(found):
            mark, words, target = found.groups()
            if target is None or re.match(r"[a-z]+:|#", target):
                return found.group()
            file, hash_, anchor = target.partition("#")
            named = os.path.normpath(os.path.join(os.path.dirname(path), file))
            if named not in self.files:
                return words
            return f"{mark}[{words}]({self.link(path, named)}{hash_}{anchor})"

        parts = FENCED.split(text)
        parts[::2] = [LINK.sub(moved, part) for part in parts[::2]]
        title, body = "".join(parts).split("\n", 1)
        return f"{title}\n{self.described_by(path)}{body}{self.navigation(path)}"

    def described_by(self, path):
        """The line of a guide that leads to its headers."""
        links = [f"[{header['title']}]({self.link(path, name)})"
                 for name, header in self.headers.items() if header["guide"] == path]
        return f"\n{LINKS}Reference: {' · '.join(links)}\n" if links else ""

    def navigation(self, path):
        if path != "README.md":
            return ""
        trees = []
        for group in self.groups:
            entries = [site_name(page) for page in group["pages"]]
            entries = ["Overview <self>" if entry == "index" else entry for entry in entries]
            trees.append("\n".join(["", "```{toctree}", ":hidden:", f":caption: {group['title']}",
                                    "", *entries, "```", ""]))
        return "".join(trees)

    def header(self, path):
        header = self.headers[path]
        with open(self.project / header["guide"], encoding="utf-8") as guide:
            title = guide.readline().strip("# \n")
        return (f"# {header['title']}\n\n"
                f"{LINKS}`#include <{INCLUDED.sub('', path)}>` · Guide: "
                f"[{title}]({self.link(path, header['guide'])})\n\n"
                f"```{{doxygengroup}} {pathlib.Path(path).stem}\n"
                ":members:\n:undoc-members:\n```\n")

    def manual(self, path):
        """A manual page. Its sections become those of the page, its text stays what mandoc made."""
        roff = subprocess.run(["scdoc"], input=(self.project / path).read_bytes(), check=True,
                              stdout=subprocess.PIPE).stdout
        html = subprocess.run(["mandoc", "-Thtml", "-Ofragment"], input=roff, check=True,
                              stdout=subprocess.PIPE).stdout.decode()
        html = re.search(r'<div class="manual-text">\n(.*)</div>\n<table', html, re.S).group(1)
        html = re.sub(r"</?section[^>]*>\n?", "", html)
        html = re.sub(r'<h2 class="Ss"[^>]*><a[^>]*>(.*?)</a></h2>', r"<h3>\1</h3>", html,
                      flags=re.S)
        name, number, _ = pathlib.Path(path).name.rsplit(".", 2)
        text = f"# {name}({number})\n"
        parts = re.split(r'<h1 class="Sh"[^>]*><a[^>]*>(.*?)</a></h1>\n', html, flags=re.S)
        for head, body in zip(parts[1::2], parts[2::2]):
            text += f"\n## {' '.join(head.split()).capitalize()}\n\n"
            text += "```{raw} html\n" + f'<div class="manual-text">\n{body}</div>\n```\n'
        return text


def prepare_reference(xml):
    """Gives the members of namespaces their complete names, which breathe does not look up, and
    removes overloads that exist only so that a wrong call does not compile."""
    trap = re.compile(r"<memberdef (?:(?!</memberdef>).)*?enable_if.*?</memberdef>", re.S)
    for file in [*xml.glob("group__*.xml"), *xml.glob("class*.xml")]:
        text = trap.sub("", file.read_text(encoding="utf-8"))
        if file.name.startswith("group"):
            text = re.sub(r"<name>.*?</name>(\s*)<qualifiedname>(.*?)</qualifiedname>",
                          r"<name>\2</name>\1<qualifiedname>\2</qualifiedname>", text)
        file.write_text(text, encoding="utf-8")


if __name__ == "__main__":
    source, target, reference = map(pathlib.Path, sys.argv[1:])
    prepare_reference(reference)
    Site(source, target).write()
