"""Finds every log line that C++ sources can write.

A call such as

    Log::error(kModule, 32, "rmdir %s failed. %m", path);

states module, number and text itself. If the number or the text is a parameter or a member, its
values are traced: those of a parameter to the calls of its function, those of a member to the
constant records of its type. A value that cannot be traced is an error; no line is omitted.
"""
import dataclasses
import re

LOG_CALL = re.compile(r"\bLog::(error|debug|bare)\s*\(")
FUNCTION = re.compile(r"([A-Za-z_]\w*)\s*\(([^;{}()]*(?:\([^;{}()]*\)[^;{}()]*)*)\)\s*"
                      r"(?:const\s*)?(?:noexcept\s*)?(?::[^;{}]*)?\{")
NO_FUNCTIONS = {"if", "for", "while", "switch", "catch", "return"}
CONVERSION = re.compile(r"%(?:%|m|[-+ #0]*(?:\d+|\*)?(?:\.\d+)?(?:hh|h|ll|l|z|j|t)?[a-zA-Z])")
MOST_STEPS = 8


class CannotFollow(Exception):
    """A log line whose number or text cannot be determined from the sources."""


@dataclasses.dataclass(frozen=True, order=True)
class Message:
    module: str
    number: int
    priority: str
    plain: bool  # without pid and tag
    text: str


@dataclasses.dataclass
class Function:
    name: str
    parameters: list
    begin: int
    end: int


def without_comments(code):
    """Replaces comments by spaces, which keeps positions. String literals are not changed."""
    pattern = re.compile(r'"(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])*\'|//[^\n]*|/\*.*?\*/', re.S)

    def blank(found):
        text = found.group()
        return re.sub(r"[^\n]", " ", text) if text.startswith("/") else text

    return pattern.sub(blank, code)


def closing(code, position):
    """The position of the bracket that closes the one at the given position."""
    depth = 0
    for found in re.compile(r'"(?:\\.|[^"\\])*"|\'(?:\\.|[^\'\\])\'|[(){}\[\]]').finditer(code,
                                                                                      position):
        if found.group() in "([{":
            depth += 1
        elif found.group() in ")]}":
            depth -= 1
            if depth == 0:
                return found.start()
    raise CannotFollow("unbalanced brackets")


def split_arguments(text):
    parts, depth, begin = [], 0, 0
    for found in re.finditer(r'"(?:\\.|[^"\\])*"|\'(?:\\.|[^\'\\])\'|[(){}\[\],]', text):
        if found.group() in "([{":
            depth += 1
        elif found.group() in ")]}":
            depth -= 1
        elif found.group() == "," and depth == 0:
            parts.append(text[begin:found.start()].strip())
            begin = found.end()
    last = text[begin:].strip()
    return parts + [last] if parts or last else []


def literal(expression):
    """The value of a number or string literal, with adjacent strings joined; otherwise None."""
    if re.fullmatch(r"\d+", expression):
        return int(expression)
    if re.fullmatch(r'"(?:\\.|[^"\\])*"(?:\s*"(?:\\.|[^"\\])*")*', expression):
        parts = re.findall(r'"((?:\\.|[^"\\])*)"', expression)
        return "".join(parts).replace('\\"', '"').replace("\\\\", "\\")
    return None


class File:
    def __init__(self, path):
        self.path = path
        self.code = without_comments(path.read_text(encoding="utf-8"))
        self.functions = list(self.find_functions())

    def find_functions(self):
        for found in FUNCTION.finditer(self.code):
            if found.group(1) not in NO_FUNCTIONS:
                names = [re.sub(r".*?(\w*)\s*(?:=.*|\[\])?$", r"\1", part, flags=re.S)
                         for part in split_arguments(found.group(2))]
                begin = found.end() - 1
                yield Function(found.group(1), names, begin, closing(self.code, begin))

    def enclosing(self, position):
        around = [f for f in self.functions if f.begin < position < f.end]
        return max(around, key=lambda f: f.begin) if around else None

    def where(self, position):
        return f"{self.path}:{self.code.count(chr(10), 0, position) + 1}"


class Folder:
    """The sources of one module. A definition may be in another file than its use."""

    def __init__(self, path):
        self.files = [File(p) for p in sorted(path.glob("*.cpp")) + sorted(path.glob("*.h"))]

    def constant(self, name, file):
        pattern = re.compile(r"\bconstexpr\b[^;=]*\b" + name + r"(?:\[\])?\s*=\s*([^;]+);")
        headers = [f for f in self.files if f.path.suffix == ".h"]
        for candidate in [file] + headers:
            found = pattern.search(candidate.code)
            if found:
                return literal(found.group(1).strip())
        return None

    def calls(self, name):
        """The calls of a function, without declarations: file, position and arguments."""
        for file in self.files:
            for found in re.finditer(r"\b" + name + r"\s*\(", file.code):
                before = re.search(r"([\w>&*]*)\s*$", file.code[:found.start()]).group(1)
                if before in ("", "return", "&&") and file.enclosing(found.start()):
                    end = closing(file.code, found.end() - 1)
                    yield file, found.start(), split_arguments(file.code[found.end():end])

    def records(self, member):
        """The values of a member in the constant records of its type."""
        for file in self.files:
            for struct in re.finditer(r"\bstruct\s+(\w+)\s*\{([^{}]*)\}", file.code):
                fields = re.findall(r"(\w+)\s*;", struct.group(2))
                if member in fields:
                    yield from self.aggregates(struct.group(1), fields)

    def aggregates(self, type_name, fields):
        pattern = re.compile(r"\b" + type_name + r"\s+\w+\s*=\s*\{([^{}]*)\}")
        for file in self.files:
            for found in pattern.finditer(file.code):
                yield dict(zip(fields, map(literal, split_arguments(found.group(1)))))

    def bindings(self, expressions, file, position, steps=MOST_STEPS):
        """All combinations of values that the expressions can have there, one dictionary each."""
        known = {e: self.plain_value(e, file) for e in expressions}
        unknown = [e for e, value in known.items() if value is None]
        if not unknown:
            return [known]
        members = {e: re.fullmatch(r"\w+(?:\.|->)(\w+)", e) for e in unknown}
        if all(members.values()):
            names = {e: found.group(1) for e, found in members.items()}
            return [{**known, **{e: record[name] for e, name in names.items()}}
                    for record in self.records(next(iter(names.values())))]
        return [{**known, **found}
                for found in self.from_callers(unknown, file, position, steps)]

    def from_callers(self, names, file, position, steps):
        function = file.enclosing(position)
        if steps == 0 or not function or any(n not in function.parameters for n in names):
            raise CannotFollow(f"{file.where(position)}: {', '.join(names)} cannot be followed")
        for at_file, at, arguments in self.calls(function.name):
            if len(arguments) != len(function.parameters):
                continue  # another function with the same name
            given = {name: arguments[function.parameters.index(name)] for name in names}
            for values in self.bindings(list(given.values()), at_file, at, steps - 1):
                yield {name: values[given[name]] for name in names}

    def plain_value(self, expression, file):
        value = literal(expression)
        if value is None and re.fullmatch(r"k[A-Z]\w*", expression):
            value = self.constant(expression, file)
        return value

    def messages(self):
        for file in self.files:
            past = re.search(r"\bv?syslog\s*\(", file.code)
            if past and file.path.parts[-2:] != ("base", "log_line.cpp"):
                raise CannotFollow(f"{file.where(past.start())}: writes past base/log_line.h")
            for found in LOG_CALL.finditer(file.code):
                end = closing(file.code, found.end() - 1)
                arguments = split_arguments(file.code[found.end():end])
                yield from self.messages_of(found.group(1), arguments, file, found.start())

    def messages_of(self, kind, arguments, file, position):
        priority = {"error": "LOG_ERR", "debug": "LOG_DEBUG"}.get(kind)
        if kind == "bare":
            priority, arguments = arguments[0], arguments[1:]
        module, text = self.plain_value(arguments[0], file), literal(arguments[2])
        if not isinstance(module, str) or not isinstance(text, str) or \
                not priority.startswith("LOG_"):
            raise CannotFollow(f"{file.where(position)}: module, priority and text must be plain")
        words = self.words(text, arguments[3:], file, position)
        found_any = False
        for values in self.bindings([arguments[1]] + words, file, position):
            found_any = True
            yield Message(module, values[arguments[1]], priority, kind == "bare",
                          substituted(text, arguments[3:], values))
        if not found_any:
            raise CannotFollow(f"{file.where(position)}: nothing calls this log line")

    def words(self, text, arguments, file, position):
        """The arguments of %s that are constants in the sources and therefore part of the text."""
        result = []
        for spec, argument in conversions(text, arguments):
            if spec.endswith("s") and re.fullmatch(r"[\w.]+", argument):
                try:
                    values = self.bindings([argument], file, position)
                    if values and all(isinstance(v[argument], str) for v in values):
                        result.append(argument)
                except CannotFollow:
                    pass  # known only at run time
        return result


def conversions(text, arguments):
    specs = [s for s in CONVERSION.findall(text) if s not in ("%%", "%m")]
    return list(zip(specs, arguments))


def substituted(text, arguments, values):
    rest = iter(arguments)

    def put(found):
        if found.group() in ("%%", "%m"):
            return found.group()
        word = values.get(next(rest, None))
        return word if isinstance(word, str) else found.group()

    return CONVERSION.sub(put, text)


def all_messages(root, folders):
    found = set()
    for folder in folders:
        found.update(Folder(root / folder).messages())
    return sorted(found)
