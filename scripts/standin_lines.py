"""Finds every log line that the platform stand-ins can write.

They call syslog(3) with a literal text, which begins with "kovasdk: " or "kovaplatform: ". The line
about a mistake in the configuration ends in the words of the mistake; each of these makes a line of
its own.
"""
import dataclasses
import re

import log_calls

PREFIX = re.compile(r"(kova\w+): ")
SYSLOG = re.compile(r"\bsyslog\s*\(")
MISTAKE = re.compile(r"(?:\bfail\s*(?=\()|(?=\{))[({]\s*KOVA_CONF_ERR_\w+\s*,")
MISTAKES_WORDS = "error.what.c_str()"


@dataclasses.dataclass(frozen=True, order=True)
class Line:
    module: str
    priority: str
    text: str


def terms(expression):
    """The terms of a concatenation: "a" + b + c()."""
    parts, depth, begin = [], 0, 0
    for found in re.finditer(r'"(?:\\.|[^"\\])*"|[()\[\]{}+]', expression):
        if found.group() in "([{":
            depth += 1
        elif found.group() in ")]}":
            depth -= 1
        elif found.group() == "+" and depth == 0:
            parts.append(expression[begin:found.start()].strip())
            begin = found.end()
    return parts + [expression[begin:].strip()]


def texts_of(expression, folder, file, position):
    """The texts that an expression of type std::string can have, with %s for what varies."""
    texts = [""]
    for term in terms(expression):
        term = re.sub(r"^std::string\((.*)\)$", r"\1", term, flags=re.S)
        values = [log_calls.literal(term)]
        if term == "std::strerror(errno)":
            values = ["%m"]
        elif values == [None]:
            values = parameter_values(term, folder, file, position) or ["%s"]
        texts = [text + value for text in texts for value in values]
    return texts


def parameter_values(name, folder, file, position):
    """The constants that all callers pass for a parameter; None when it is not one, or varies."""
    try:
        found = [binding[name] for binding in folder.bindings([name], file, position)]
    except log_calls.CannotFollow:
        return None
    return found if found and all(isinstance(value, str) for value in found) else None


def mistakes(folders):
    """What can be wrong with a configuration: whether it has a line number, and the words."""
    for folder in folders:
        for file in folder.files:
            for found in MISTAKE.finditer(file.code):
                bracket = re.search(r"[({]", file.code[found.start():]).start() + found.start()
                end = log_calls.closing(file.code, bracket)
                _, line, words = log_calls.split_arguments(file.code[bracket + 1:end])
                for text in texts_of(words, folder, file, found.start()):
                    yield line != "0", text


def lines_of(call, file, position, all_mistakes):
    priority, text = call[0], log_calls.literal(call[1])
    prefix = PREFIX.match(text) if isinstance(text, str) else None
    if not prefix or not priority.startswith("LOG_"):
        raise log_calls.CannotFollow(f"{file.where(position)}: priority and text must be plain, "
                                     "and the text must begin with the name of the library")
    if call[-1] != MISTAKES_WORDS:
        yield Line(prefix.group(1), priority, text)
        return
    for has_line, words in all_mistakes:
        if has_line == ("%d" in text):
            yield Line(prefix.group(1), priority, text[:-len("%s")] + words)


def all_lines(root):
    paths = sorted({source.parent for source in (root / "platform").rglob("*.cpp")})
    folders = [log_calls.Folder(path) for path in paths]
    all_mistakes = list(mistakes(folders))
    found = set()
    for folder in folders:
        for file in folder.files:
            for call in SYSLOG.finditer(file.code):
                end = log_calls.closing(file.code, call.end() - 1)
                arguments = log_calls.split_arguments(file.code[call.end():end])
                found.update(lines_of(arguments, file, call.start(), all_mistakes))
    return sorted(found)
