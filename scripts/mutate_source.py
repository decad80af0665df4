"""Finds the small changes that scripts/mutate makes to a source, and writes them all into a copy of
it, each behind a number that is chosen at run time.

The sources are formatted by clang-format, which tells operators apart: a binary one has white space
on both sides, a unary one none behind it, and the bracket of a template none before it. A change that
is misunderstood does not compile, and the build leaves it out.
"""
import hashlib
import re
from typing import NamedTuple

TOKEN = re.compile(r"""
    (?P<comment> //[^\n]* | /\*.*?\*/ )
  | (?P<directive> ^[ \t]*\#(?:\\\n|[^\n])* )
  | (?P<raw> R"(?P<mark>[^(\s]*)\(.*?\)(?P=mark)" )
  | (?P<string> (?:u8|[uUL])?"(?:\\.|[^"\\])*" )
  | (?P<char> [uUL]?'(?:\\.|[^'\\])+' )
  | (?P<number> \d(?:'?[\w.])* )
  | (?P<name> [A-Za-z_]\w* )
  | (?P<sign> <<=|>>=|\.\.\.|->\*|->|::|\+\+|--|<<|>>|<=|>=|==|!=|&&|\|\||[-+*/%&|^]=|. )
""", re.X | re.S | re.M)

PRECEDENCE = {"*": 5, "/": 5, "%": 5, "+": 6, "-": 6, "<<": 7, ">>": 7, "<": 9, "<=": 9, ">": 9,
              ">=": 9, "==": 10, "!=": 10, "&": 11, "^": 12, "|": 13, "&&": 14, "||": 15}
STOPS = {"?", ":", "=", "+=", "-=", "*=", "/=", "%=", "&=", "|=", "^=", "<<=", ">>=", ",", ";"}
OPENING = {"(": ")", "[": "]", "{": "}"}
CLOSING = set(OPENING.values())
STATEMENT_WORDS = {"return", "throw", "case", "else", "do", "new", "delete", "goto", "co_return"}
NOT_CALLED = STATEMENT_WORDS | {
    "if", "for", "while", "switch", "using", "break", "continue", "default", "static_assert",
    "sizeof", "decltype", "typedef", "template", "friend", "public", "private", "protected",
    "catch", "try", "operator", "static", "const", "auto", "explicit", "virtual", "noexcept"}
TURNED = {"<": "<=", "<=": "<", ">": ">=", ">=": ">", "==": "!=", "!=": "==", "&&": "||",
          "||": "&&", "+": "-", "-": "+"}
OPERATOR_KINDS = {"<": "boundary", "<=": "boundary", ">": "boundary", ">=": "boundary",
                  "==": "equality", "!=": "equality", "&&": "logic", "||": "logic",
                  "+": "arithmetic", "-": "arithmetic"}
FLAG = re.compile(r"(::)?[A-Z][A-Z0-9]*_[A-Z0-9_]+$")
NO_FLAGS = {"O_RDONLY", "PROT_NONE"}  # zero: without them nothing changes


class Token(NamedTuple):
    kind: str
    text: str
    start: int
    end: int


class Mutant(NamedTuple):
    ident: str  # the same as long as the line stays the same
    path: str
    line: int
    kind: str
    change: str  # for people
    start: int
    end: int
    before: str  # inserted at start and end; "@" is the mutant's number
    after: str


class Change(NamedTuple):
    kind: str
    change: str
    start: int
    end: int
    before: str
    after: str


def tokens_of(text):
    """The tokens of a source, without white space and comments."""
    found = []
    for match in TOKEN.finditer(text):
        kind = match.lastgroup if match.lastgroup != "mark" else "raw"
        if kind == "comment" or match.group().isspace():
            continue
        found.append(Token(kind, match.group(), match.start(), match.end()))
    return found


class Source:
    """A source's tokens and what belongs together in it."""

    def __init__(self, text):
        self.text = text
        self.tokens = tokens_of(text)
        self.match = {}
        self.inside = []  # the bracket that each token is in
        self.closers = set()
        self._match_brackets()
        self._match_angles()
        self.skipped = self._skipped()

    def word(self, i):
        return self.tokens[i].text if 0 <= i < len(self.tokens) else ""

    def space_before(self, i):
        start = self.tokens[i].start
        return start == 0 or self.text[start - 1].isspace()

    def space_after(self, i):
        end = self.tokens[i].end
        return end >= len(self.text) or self.text[end].isspace()

    def is_binary(self, i):
        return (self.word(i) in PRECEDENCE and self.tokens[i].kind == "sign" and
                i not in self.match and i not in self.closers and
                self.space_before(i) and self.space_after(i))

    def _match_brackets(self):
        stack = []
        for i, token in enumerate(self.tokens):
            self.inside.append(stack[-1] if stack else None)
            if token.kind != "sign":
                continue
            if token.text in OPENING:
                stack.append(i)
            elif token.text in CLOSING and stack:
                self._pair(stack.pop(), i)

    def _pair(self, first, last):
        self.match[first] = last
        self.match[last] = first

    def _match_angles(self):
        for i, token in enumerate(self.tokens):
            if token.text == "<" and token.kind == "sign" and (
                    not self.space_before(i) or self.word(i - 1) == "template"):
                last = self._angle_end(i)
                if last is not None:
                    self.match[i] = last
                    self.match.setdefault(last, i)
                    self.closers.add(last)

    def _angle_end(self, i):
        depth = 0
        while i < len(self.tokens):
            word = self.word(i)
            if word in "([{" and i in self.match:
                i = self.match[i]
            elif word == "<":
                depth += 1
            elif word in (">", ">>"):
                depth -= len(word)
                if depth <= 0:
                    return i
            elif word in (";", ")", "}", "&&", "||"):
                return None
            i += 1
        return None

    def _skipped(self):
        """The tokens that must stay: constants of the compiler, types, declarations."""
        skipped = set()
        for i, token in enumerate(self.tokens):
            last = None
            if token.kind == "directive":
                last = i
            elif token.text == "constexpr":
                last = self._constexpr_end(i)
            elif token.text in ("static_assert", "sizeof", "decltype", "alignas", "noexcept"):
                last = self.match.get(i + 1) if self.word(i + 1) == "(" else None
            elif token.text in ("using", "typedef", "extern"):
                last = self._find(i, ";")
            elif token.text == "case":
                last = self._find(i, ":")
            elif token.text == "enum":
                last = self._find(i, ";")
            elif token.text == "operator":
                last = i + 1
            elif token.text == "<" and i in self.match:
                last = self.match[i]
            elif token.text == "[" and self.word(i + 1) == "[":
                last = self.match.get(i)
            elif token.text == "[" and self._declares_array(i):
                last = self.match[i]
            if last is not None:
                skipped.update(range(i, last + 1))
        return skipped

    def _find(self, i, word):
        while i < len(self.tokens) and self.word(i) != word:
            i = self.match[i] + 1 if self.word(i) in OPENING and i in self.match else i + 1
        return min(i, len(self.tokens) - 1)

    def _constexpr_end(self, i):
        if self.word(i - 1) == "if":
            return self.match.get(i + 1)
        assigned = False
        while i < len(self.tokens):
            word = self.word(i)
            assigned = assigned or word == "="
            if word == ";":
                return i
            if word in OPENING and i in self.match:
                i = self.match[i]
                if word == "{" and not assigned and self.word(i + 1) != ";":
                    return i
            i += 1
        return len(self.tokens) - 1

    def _declares_array(self, i):
        return (i >= 2 and i in self.match and self.tokens[i - 1].kind == "name" and
                (self.tokens[i - 2].kind == "name" or self.word(i - 2) in ("*", ">")) and
                self.word(i - 2) not in STATEMENT_WORDS)

    def left_of(self, op, level):
        """The first token of the operand that ends before op."""
        i = op - 1
        while i >= 0:
            word = self.word(i)
            if self._ends_operand(i, level, same=False):
                break
            if word in CLOSING or i in self.closers:
                if word == "}" and not self._is_operand_brace(i):
                    break
                i = self.match.get(i, i)
            i -= 1
        return i + 1

    def right_of(self, op, level):
        """The last token of the operand that begins after op."""
        i = op + 1
        while i < len(self.tokens):
            if self._ends_operand(i, level, same=True):
                break
            if i in self.match and self.match[i] > i:
                i = self.match[i]
            i += 1
        return i - 1

    def _ends_operand(self, i, level, same):
        word = self.word(i)
        kind = self.tokens[i].kind
        if kind == "directive" or (kind == "name" and word in STATEMENT_WORDS):
            return True
        if kind != "sign":
            return False
        if word in STOPS:
            return True
        if self.is_binary(i):
            return PRECEDENCE[word] > level or (same and PRECEDENCE[word] == level)
        if word in OPENING:
            return self.match.get(i, -1) < i or not same
        return word in CLOSING and same

    def _is_operand_brace(self, i):
        return self.word(i + 1) in PRECEDENCE or self.word(i + 1) in (".", "?", "(", ",")

    def is_in_function(self, i):
        """Whether a token is directly in a block of statements."""
        brace = self.inside[i]
        if brace is None or self.word(brace) != "{":
            return False
        k = brace - 1
        while k >= 0 and self.word(k) not in (";", "{", "}", ")"):
            if self.word(k) in ("class", "struct", "namespace"):
                return False
            k -= 1
        return True

    def piece(self, first, last):
        """The text of some tokens on one line, without comments."""
        parts = []
        for i in range(first, last + 1):
            if i > first and self.tokens[i].start > self.tokens[i - 1].end:
                parts.append(" ")
            parts.append(self.tokens[i].text)
        return "".join(parts)


def expression(source, kind, first, last, other, change):
    return Change(kind, change, source.tokens[first].start, source.tokens[last].end,
                  f"(::kovaMutant(@) ? ({other}) : (", "))")


def operator_changes(source, i):
    """A binary operator becomes its neighbour, and an operand of && and || is left out."""
    word = source.word(i)
    if word not in TURNED or not source.is_binary(i):
        return
    first = source.left_of(i, PRECEDENCE[word])
    last = source.right_of(i, PRECEDENCE[word])
    left, right = source.piece(first, i - 1), source.piece(i + 1, last)
    if not left or not right or (word in "+-" and '"' in left + right):
        return
    yield expression(source, OPERATOR_KINDS[word], first, last, f"{left} {TURNED[word]} {right}",
                     f"{left} [{word} -> {TURNED[word]}] {right}")
    if word in ("&&", "||"):
        for kept, gone in ((right, left), (left, right)):
            yield expression(source, "operand", first, last, f"static_cast<bool>({kept})",
                             f"{left} {word} {right}: without {gone}")


def not_changes(source, i):
    """The ! before an operand is left out."""
    if source.word(i) != "!" or source.space_after(i):
        return
    last = source.right_of(i, 0)
    operand = source.piece(i + 1, last)
    if operand:
        yield expression(source, "not", i, last, f"static_cast<bool>({operand})", f"[!]{operand}")


def condition_changes(source, i):
    """The condition of an if, or the one before a question mark, is negated."""
    word = source.word(i)
    if word == "if" and source.word(i + 1) == "(" and i + 1 in source.match:
        first, last = i + 2, source.match[i + 1] - 1
    elif word == "?" and source.tokens[i].kind == "sign":
        first, last = source.left_of(i, 15), i - 1
    else:
        return
    inner = range(first, last + 1)
    if first > last or any(source.word(k) in (";", "=") for k in inner):
        return
    if any(source.is_binary(k) and PRECEDENCE[source.word(k)] >= 9 for k in inner):
        return  # the operator is changed instead
    if source.word(first) == "!":
        return
    piece = source.piece(first, last)
    yield Change("condition", f"{word} [!]({piece})", source.tokens[first].start,
                 source.tokens[last].end, "(::kovaMutant(@) != static_cast<bool>(", "))")


def literal_changes(source, i):
    token = source.tokens[i]
    if token.text in ("true", "false"):
        kind = "return" if source.word(i - 1) == "return" else "literal"
        other = "false" if token.text == "true" else "true"
        yield expression(source, kind, i, i, other, f"{token.text} -> {other}")
        return
    number = re.fullmatch(r"(0[xX][0-9a-fA-F]+|\d+)([uUlL]*)", token.text)
    if token.kind != "number" or not number:
        return
    digits, suffix = number.groups()
    octal = len(digits) > 1 and digits[0] == "0" and digits.isdigit()
    value = int(digits, 8) if octal else int(digits, 0)
    if source.word(i - 1) == "-" and source.word(i - 2) == "return" and value == 1:
        yield expression(source, "return", i - 1, i, "0", "-1 -> 0")
        return
    for step in (1, -1):
        if value + step >= 0:
            other = ("0%o" if octal else "%d") % (value + step) + suffix
            yield expression(source, "constant", i, i, other, f"{token.text} -> {other}")


def flag_changes(source, i):
    """One flag of several is left out."""
    if source.word(i) != "|" or not source.is_binary(i):
        return
    first = source.left_of(i, PRECEDENCE["|"])
    if any(source.word(k) == "|" for k in range(first, i)):
        return  # the first | of a row stands for all
    flags = [source.word(first) if i - first == 1 else source.piece(first, i - 1)]
    at = i
    while source.word(at) == "|" and source.is_binary(at):
        last = source.right_of(at, PRECEDENCE["|"])
        flags.append(source.piece(at + 1, last))
        at = last + 1
    if not all(FLAG.match(flag) for flag in flags):
        return
    for gone in flags:
        rest = " | ".join(flag for flag in flags if flag != gone)
        if gone not in NO_FLAGS and rest:
            yield expression(source, "flag", first, at - 1, rest, f"{' | '.join(flags)}: without {gone}")


def retry_changes(source, i):
    if source.word(i) != "retryOnEintr" or source.word(i + 1) != "(" or source.word(i - 1) == "auto":
        return  # "auto": its definition
    first = i
    while source.word(first - 1) == "::" and source.tokens[first - 2].kind == "name":
        first -= 2
    last = source.match[i + 1]
    yield expression(source, "retry", first, last, f"::kovaOnce{source.piece(i + 1, last)}",
                     "without the retry on EINTR: " + source.piece(i + 1, last))


def call_statement(source, i):
    """The last token of the statement that begins at i, if it is only a call."""
    previous = source.word(i - 1)
    if previous not in (";", "{", "}", ")", "else") or source.word(i) in NOT_CALLED:
        return None
    if not source.is_in_function(i):
        return None
    if previous == ")" and source.word(source.match.get(i - 1, 0) - 1) not in ("if", "for", "while"):
        return None
    if [source.word(k) for k in (i, i + 1, i + 2)] == ["(", "void", ")"]:
        i += 3
    return _call_end(source, i)


def _call_end(source, i):
    after_operand = False
    while i < len(source.tokens):
        token = source.tokens[i]
        if token.text == ";":
            return i if source.word(i - 1) == ")" else None
        if token.kind == "name":
            if after_operand or token.text in NOT_CALLED:
                return None
            after_operand = True
        elif token.text in ("::", ".", "->"):
            after_operand = False
        elif token.text == "(" and source.word(i + 1) == "*" and source.word(i + 3) == ")":
            return None  # declares a pointer to a function
        elif token.text in "([" or (token.text == "<" and i in source.match):
            i = source.match.get(i, len(source.tokens))
            after_operand = True
        else:
            return None
        i += 1
    return None


def call_changes(source, i):
    """A call whose result is not used is left out, or made after the next one."""
    last = call_statement(source, i)
    if last is None:
        return
    start, end = source.tokens[i].start, source.tokens[last].end
    call = source.piece(i, last)
    yield Change("call", f"without {call}", start, end, "{ if (!::kovaMutant(@)) { ", " } }")
    if last + 1 < len(source.tokens) and source.word(i - 1) in (";", "{", "}"):
        second = call_statement(source, last + 1)
        if second is not None:
            other = source.piece(last + 1, second)
            yield Change("order", f"{other} before {call}", start, source.tokens[second].end,
                         f"{{ if (::kovaMutant(@)) {{ {other} {call} }} else {{ ", " } }")


FINDERS = (operator_changes, not_changes, condition_changes, literal_changes, flag_changes,
           retry_changes, call_changes)


def changes_of(source):
    swapped_to = -1
    for i in range(len(source.tokens)):
        if i in source.skipped:
            continue
        for finder in FINDERS:
            for change in finder(source, i):
                if change.kind == "order":
                    if change.start < swapped_to:
                        continue  # would overlap with the pair before
                    swapped_to = change.end
                yield change


def mutants_of(path, text):
    """All mutants of a source, in the order of their places."""
    source = Source(text)
    seen = {}
    found = []
    for change in changes_of(source):
        line_start = text.rfind("\n", 0, change.start) + 1
        line = text[line_start:text.find("\n", change.start)].strip()
        key = (path, change.kind, change.change, line)
        seen[key] = seen.get(key, 0) + 1
        ident = hashlib.sha256(repr((key, seen[key])).encode()).hexdigest()[:10]
        number = text.count("\n", 0, change.start) + 1
        found.append(Mutant(ident, path, number, *change))
    return found


def render(text, header, path, numbered):
    """The source with its mutants, as (number, mutant) pairs. Line numbers stay, and the compiler
    takes the file for a system header, about which it does not warn."""
    inserts = []
    for number, mutant in numbered:
        length = mutant.end - mutant.start
        inserts.append((mutant.start, 1, -length, number, mutant.before.replace("@", str(number))))
        inserts.append((mutant.end, 0, length, -number, mutant.after))
    inserts.sort()
    parts, at = [], 0
    for place, _, _, _, inserted in inserts:
        parts.append(text[at:place] + inserted)
        at = place
    parts.append(text[at:])
    return f'#include "{header}"\n# 1 "{path}" 3\n' + "".join(parts)
