"""The places of a source that can be changed, one at a time, and what each becomes."""
import re
from dataclasses import dataclass

FLIPPED = {"==": "!=", "!=": "==", "<": "<=", "<=": "<", ">": ">=", ">=": ">"}


@dataclass(frozen=True, order=True)
class Mutant:
    path: str
    start: int  # offsets in the file
    end: int
    kind: str
    after: str
    line: int
    text: str  # of the line, stripped

    def applied(self, source):
        return source[:self.start] + self.after + source[self.end:]

    def key(self):
        return self.path, self.kind, self.text

    def __str__(self):
        return f"{self.path}:{self.line}: {self.kind}: {self.text}"


def blanked(source, pattern):
    return re.sub(pattern, lambda match: re.sub(r"[^\n]", " ", match.group()), source, flags=re.DOTALL)


def code_of(source):
    """The source with all that is no code to change blanked out, at the same offsets."""
    quiet = re.sub(r'//[^\n]*|/\*.*?\*/|R"\((?:.*?)\)"|"(?:\\.|[^"\\\n])*"|(?<![0-9A-Fa-f])\'(?:\\.|[^\'\\\n])+\'',
                   lambda match: re.sub(r"[^\n]", " " if match.group()[0] == "/" else "_", match.group()), source,
                   flags=re.DOTALL)
    quiet = blanked(quiet, r"(?m:^\s*#(?:[^\n\\]|\\\n|\\.)*)")
    for match in re.finditer(r"\bif (\()", quiet):
        end = closing(quiet, match.start(1))
        log = end and re.compile(r"\)\s*(?:\{\s*QV_LOG\w*\([^;]*;\s*\}(?!\s*else)|QV_LOG)").match(quiet, end)
        if log:  # what only chooses a log line
            quiet = quiet[:match.start()] + " " * (end - match.start()) + quiet[end:]
    return blanked(quiet, r"\b(?:QV_LOG\w*|static_assert)\s*\([^;]*;")


def closing(code, opening):
    """The offset of the bracket that closes the one at `opening`; None where there is none."""
    depth = 0
    for offset in range(opening, len(code)):
        if code[offset] in "([{":
            depth += 1
        elif code[offset] in ")]}":
            depth -= 1
            if depth == 0:
                return offset
    return None


def negations(code):
    for match in re.finditer(r"\bif (\()", code):
        end = closing(code, match.start(1))
        if end is None:
            continue
        condition = code[match.end():end]
        begin = match.end() + condition.rfind(";") + 1  # after what `if` declares first
        condition = code[begin:end]
        if not re.search(r"[^=!<>]=[^=]", condition):  # a declaration is no expression
            yield begin, end, "negated condition", lambda text: f"!({text.strip()})"


def operators(code):
    for match in re.finditer(r" (==|!=|<=|>=|<|>) ", code):
        other = FLIPPED[match.group(1)]
        yield match.start(1), match.end(1), f"{match.group(1)} to {other}", lambda _, other=other: other
    for match in re.finditer(r" (&&|\|\|) ", code):
        other = "||" if match.group(1) == "&&" else "&&"
        yield match.start(1), match.end(1), f"{match.group(1)} to {other}", lambda _, other=other: other


def constants(code):
    for match in re.finditer(r"(?<![\w.'])(\d[\d']*)(?![\w.'])", code):
        value = int(match.group(1).replace("'", ""))
        yield match.start(), match.end(), "changed constant", lambda _, value=value: str(value + 1)
    for match in re.finditer(r"\b(true|false)\b", code):
        other = "false" if match.group() == "true" else "true"
        yield match.start(), match.end(), "changed constant", lambda _, other=other: other


def statements(code):
    """Calls and assignments that stand on one line of their own; no declarations."""
    place = r"[*(]*[A-Za-z_]\w*(?:(?:::|\.|->)[A-Za-z_]\w*|\[[^\]\n]*\]|\([^()\n]*\)|\))*"
    pattern = rf"(?m)(?<=[;{{}}])\n[ ]+((?!return\b|throw\b|delete\b|using\b)(?:\+\+|--)?{place}\s*(?:[-+|&]?= |\(|;)[^;{{}}\n]*;)$|" \
              rf"(?<=[;{{}}])\n[ ]+((?:\+\+|--){place};)$"
    position = 0
    while match := re.compile(pattern).search(code, position):
        group = 1 if match.group(1) else 2
        yield match.start(group), match.end(group), "dropped statement", lambda _: ";"
        position = match.end()  # which ends with the semicolon that the next one looks back at


def mutants_of(path, source):
    code = code_of(source)
    for generate in (negations, operators, constants, statements):
        for start, end, kind, change in generate(code):
            line = source.count("\n", 0, start) + 1
            text = source.split("\n")[line - 1].strip()
            yield Mutant(path, start, end, kind, change(source[start:end]), line, text)
