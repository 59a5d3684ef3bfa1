"""Small faults as a person makes them: which of them a source has room for, line by line."""
import collections
import re

# `line` counts from 1; `old` and `new` are the whole line.
Mutant = collections.namedtuple("Mutant", "path line old new")

LITERAL = re.compile(r'"(?:\\.|[^"\\])*"|\'(?:\\.|[^\'\\])*\'')
# clang-format puts spaces around operators and none into templates, so that one can be told from the other.
SWAPS = [(" < ", " <= "), (" <= ", " < "), (" > ", " >= "), (" >= ", " > "), (" == ", " != "), (" != ", " == "),
         (" && ", " || "), (" || ", " && "), (" + ", " - "), (" - ", " + "), (" += ", " -= "), (" -= ", " += "),
         ("++", "--")]
WORDS = {"true": "false", "false": "true"}
NUMBER = re.compile(r"(?<![\w.])\d+(?![\w.])")
NOT = re.compile(r"(?<![\w)])!(?=[\w(])")
CONDITION = re.compile(r"(if|while) \((?:.*; )?(?P<condition>.+)\)(?: \{)?$")
# A call or an assignment that stands on a line of its own; what declares something has a space before. Memory that is not
# given back is for other tools to find.
STATEMENT = re.compile(r"(?!return\b|break\b|continue\b|delete\b|using\b)"
                       r"(?:[\w:.\[\]()*>-]+ (?:[-+|&]?=|<<) .*|[\w:.\[\]()*>-]+\(.*\)|(?:\+\+|--)[\w.>-]+);$")


def blanked(line):
    """Without what stands in literals and comments, in the same columns."""
    code = LITERAL.sub(lambda literal: '"' * len(literal[0]), line)
    comment = code.find("//")
    return code if comment < 0 else code[:comment].rstrip()


def is_balanced(text):
    depth = 0
    for each in text:
        depth += (each == "(") - (each == ")")
        if depth < 0:
            return False
    return depth == 0


def changes(code, line, before):
    """New texts of the line. `code` is the line blanked, `before` the code that goes before it."""
    for old, new in SWAPS:
        for found in re.finditer(re.escape(old), code):
            yield line[:found.start()] + new + line[found.end():]
    for word, other in WORDS.items():
        for found in re.finditer(rf"\b{word}\b", code):
            yield line[:found.start()] + other + line[found.end():]
    for found in NUMBER.finditer(code):
        yield line[:found.start()] + {"0": "1", "1": "0"}.get(found[0], str(int(found[0]) + 1)) + line[found.end():]
    for found in NOT.finditer(code):
        yield line[:found.start()] + line[found.end():]
    condition = CONDITION.search(code)
    if condition and is_balanced(condition["condition"]):
        start, end = condition.span("condition")
        yield f"{line[:start]}!({line[start:end]}){line[end:]}"
    stripped = code.strip()
    if STATEMENT.match(stripped) and is_balanced(stripped) and before.endswith((";", "{", "}", ")", ":", "else")):
        yield line[:len(line) - len(line.lstrip())] + ";"


def mutants_of(path, text):
    found, before = [], ""
    for number, line in enumerate(text.split("\n"), 1):
        code = blanked(line)
        if code.strip() and not code.startswith("#"):
            # Lines for the log decide nothing.
            if "LogFile::" not in code:
                found += [Mutant(path, number, line, new) for new in dict.fromkeys(changes(code, line, before))]
            before = code.strip()
    return found
