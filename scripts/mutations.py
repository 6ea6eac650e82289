"""Finds what can be broken in a C++ source: see scripts/mutate."""

import re
from typing import NamedTuple

COMMENT_OR_TEXT = re.compile(
    r'//[^\n]*|/\*.*?\*/|R"\((?:.*?)\)"|"(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])+\'|'
    r"^[ \t]*#[^\n]*(?:\\\n[^\n]*)*", re.DOTALL | re.MULTILINE)
# Log lines are words; an assertion is itself a test; reserve() changes no result.
NOT_TO_BREAK = re.compile(r"\b(?:HY_LOG\w*|assert|static_assert|[\w.>-]+reserve)\s*\(")
CONDITION = re.compile(r"\b(?:if|while)\s*\(")
DECLARATION = re.compile(r"^\s*(?:const\s+)?[A-Za-z_][\w:]*(?:<[^=]*>)?[&*\s]+(?:const\s+)?"
                         r"(\w+)\s*=[^=]")
OPERATOR = re.compile(r"(?<=\s)(&&|\|\||==|!=|<=|>=|<|>)(?=\s)")
OTHER = {"&&": "||", "||": "&&", "==": "!=", "!=": "==", "<": "<=", "<=": "<", ">": ">=",
         ">=": ">", "true": "false", "false": "true"}
NOT = re.compile(r"(?<=[\s(])!(?=[\w(])")
BOOLEAN = re.compile(r"\b(?:true|false)\b")
# Not what only sizes a buffer, as in memory_buffer<char, 64>.
NUMBER = re.compile(r"(?<![\w.'])(?!\d+>)"
                    r"(0x[0-9A-Fa-f']+|\d[\d']*(?:\.\d+)?)(?=[uUlLfF]*(?:ms|us|ns|s)?\b)(?!\.)")
CALL = re.compile(r"^[ \t]+((?:\w+(?:\(\))?(?:->|\.|::))*\w+)\(", re.MULTILINE)
NO_CALL = {"return", "if", "while", "for", "switch", "catch", "sizeof", "defined", "alignas"}


class Mutant(NamedTuple):
    """One breakage: source[start:end] of a file becomes `after`."""
    path: str
    line: int
    start: int
    end: int
    before: str
    after: str

    def apply(self, source):
        return source[:self.start] + self.after + source[self.end:]

    def __str__(self):
        def short(text):
            text = " ".join(text.split())
            return text if len(text) <= 70 else text[:67] + "..."
        return f"{self.path}:{self.line}: {short(self.before)} -> {short(self.after) or '(nothing)'}"


def closing(code, opening):
    """Where the bracket at `opening` is closed."""
    depth = 0
    for index in range(opening, len(code)):
        depth += {"(": 1, "{": 1, "[": 1, ")": -1, "}": -1, "]": -1}.get(code[index], 0)
        if depth == 0:
            return index
    return len(code) - 1


def blank(text):
    return re.sub(r"[^\n]", " ", text)


def negated(condition):
    """What holds when `condition`, as it stands in an if, does not."""
    declared, semicolon, rest = condition.rpartition(";")
    if semicolon:
        return f"{declared}; !({rest.strip()})"
    name = DECLARATION.match(condition)
    return f"{condition}; !{name[1]}" if name else f"!({condition})"


def one_more(number):
    if "." in number:
        return str(float(number) + 1)
    if number.startswith("0") and number.isdigit() and number != "0":
        return f"0{int(number, 8) + 1:o}"
    return str(int(number, 0) + 1)


def calls(code):
    """(start, end) of each statement that is one call."""
    for match in CALL.finditer(code):
        end = closing(code, match.end() - 1) + 1
        before = code[:match.start()].rstrip()
        if (match[1] not in NO_CALL and code[end:end + 1] == ";" and before
                and before[-1] in ";{}:"):
            yield match.start(1), end + 1


def breakages(path, source):
    """Every way to break one file."""
    code = COMMENT_OR_TEXT.sub(lambda match: blank(match.group()), source)
    texts = [match for match in COMMENT_OR_TEXT.finditer(source) if match.group()[0] == '"']
    for match in NOT_TO_BREAK.finditer(code):
        end = closing(code, match.end() - 1)
        code = code[:match.start()] + blank(code[match.start():end + 1]) + code[end + 1:]
        texts = [text for text in texts if not match.start() < text.start() < end]
    found = []

    def add(start, end, after):
        line = source.count("\n", 0, start) + 1
        found.append(Mutant(path, line, start, end, source[start:end], after))

    for match in CONDITION.finditer(code):
        end = closing(code, match.end() - 1)
        add(match.end(), end, negated(source[match.end():end]))
    for match in list(OPERATOR.finditer(code)) + list(BOOLEAN.finditer(code)):
        add(match.start(), match.end(), OTHER[match.group()])
    for match in NOT.finditer(code):
        add(match.start(), match.end(), "")
    for match in NUMBER.finditer(code):
        add(match.start(), match.end(1), one_more(match[1].replace("'", "")))
    for match in texts:
        if source[:match.start()].rstrip().split("\n")[-1].strip() != "extern":
            add(match.start(), match.end(), match.group()[:-1] + '~"')
    statements = list(calls(code)) if path.endswith(".cpp") else []
    for start, end in statements:
        add(start, end, "")
    for (start, end), (next_start, next_end) in zip(statements, statements[1:]):
        if end <= next_start and not code[end:next_start].strip():
            between = source[end:next_start]
            add(start, next_end, source[next_start:next_end] + between + source[start:end])
    return found
