"""Prepares the declarations of a header for its page, and leads to them from the guides."""
import functools
import re

from docutils import nodes
from sphinx import addnodes
from sphinx.domains.cpp import CPPDomain
from sphinx.util.nodes import make_refnode

NAMESPACES = re.compile(r"^KOVA::Backup::(?:Service::)?")  # not worth showing
HEADER = re.compile(r"^kova(?:backup|platform)/(?:\w+/)?(\w+)\.h$")


def unwrap_header(group):
    """Replaces the box around a header: first its description, then its classes, then the rest."""
    content = group[-1]
    text = [node for node in content if not isinstance(node, (addnodes.desc, nodes.container))]
    classes = [node for node in content if isinstance(node, addnodes.desc)]
    rest = [node for node in content if isinstance(node, nodes.container)]
    group.replace_self(text + classes + rest)


def enclosing(signature):
    """The class of which a declaration is a member, or None."""
    node = signature.parent.parent
    while node is not None and not isinstance(node, addnodes.desc):
        node = node.parent
    return node


def name_in_full(signature, name):
    """Shows the namespaces of a declaration, without those that all of them have in common."""
    last = next(signature.findall(addnodes.desc_name))
    qualifier = name.removesuffix(last.astext())
    if qualifier and enclosing(signature) is None:
        last.parent.insert(last.parent.index(last), nodes.Text(qualifier))


def add_to_contents(signature, name, seen):
    """Lists a declaration in the contents of its page, overloads once."""
    if name not in seen:
        seen.add(name)
        member = enclosing(signature) is not None
        signature["_toc_parts"] = tuple(name.split("::")) if member else (name,)
        signature["_toc_name"] = name.rpartition("::")[2] if member else name


def prepare(app, doctree):
    for declaration in list(doctree.findall(addnodes.desc)):
        if declaration.get("objtype") == "group":
            unwrap_header(declaration)
    names = {anchor: NAMESPACES.sub("", name)
             for name, _, _, page, anchor, _ in app.env.get_domain("cpp").get_objects()
             if page == app.env.docname}
    seen = set()
    for signature in doctree.findall(addnodes.desc_signature):
        name = next((names[anchor] for anchor in signature["ids"] if anchor in names), None)
        if name:
            name_in_full(signature, name)
            add_to_contents(signature, name, seen)


@functools.lru_cache(None)
def targets(domain):
    """Where each declaration is: by its last name, its name with its class, and so on."""
    found = {}
    for name, _, kind, page, anchor, _ in domain.get_objects():
        parts = NAMESPACES.sub("", name).split("::")
        if kind == "enumerator" or parts[-1] in parts[:-1]:  # a constructor's name is the class's
            continue
        for first in range(len(parts)):
            found.setdefault("::".join(parts[first:]), {}).setdefault(name, (page, anchor))
    return found


def target_of(text, names, linked):
    """The page and anchor of a name, or None if it may mean something else."""
    header = HEADER.match(text)
    if header:
        return f"reference/{header.group(1)}", ""
    found = names.get(text, {})
    if len(found) > 1:
        found = {name: place for name, place in found.items() if place[0] in linked}
    if len(found) != 1:
        return None
    name, place = next(iter(found.items()))
    alone = "::" not in text and NAMESPACES.sub("", name) != text  # a member without its class
    return None if alone and place[0] not in linked else place


def link_names(app, doctree, page):
    """Makes links of the names of headers and declarations that a guide contains as code."""
    if page.startswith(("reference/", "manual/")):
        return
    names = targets(app.env.get_domain("cpp"))
    links = (re.search(r"(reference/\w+)\.html$", node.get("refuri", ""))
             for node in doctree.findall(nodes.reference))
    linked = {link.group(1) for link in links if link}
    for literal in list(doctree.findall(nodes.literal)):
        target = target_of(literal.astext(), names, linked)
        if target and not isinstance(literal.parent, (nodes.reference, nodes.title)):
            literal.replace_self(make_refnode(app.builder, page, *target, literal.deepcopy()))


class Declarations(CPPDomain):
    """The declarations, without their parameters, which would crowd the results of a search."""

    def get_objects(self):
        return (entry for entry in super().get_objects() if not entry[2].endswith("Param"))


def setup(app):
    app.add_domain(Declarations, override=True)
    app.connect("doctree-read", prepare, priority=400)  # before the contents are collected
    app.connect("doctree-resolved", link_names)
    return {"parallel_read_safe": True, "parallel_write_safe": True}
