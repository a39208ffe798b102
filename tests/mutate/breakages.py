"""The breakages: every way in which one line of the code in question is broken, and the choice among them."""

import dataclasses
import hashlib
import pathlib
import re

# What decides over data: guards, locks, dump, unmount, format, recovery. The order is the order of the runs.
SCOPE = [
    f"src/volume/{name}.cpp"
    for name in ("unmount", "mount_point", "bare_folder", "cover", "format", "partition", "disk_identity", "disk_use",
                 "degrade", "mount", "mount_table", "mount_command")
] + ["platform/ktree/client/document.cpp", "src/tree/settings_file.cpp", "platform/shares/flash.cpp",
     "platform/shares/flashrun.cpp", "platform/shares/settings_copy.cpp", "platform/common/lock_file.cpp",
     "platform/ktree/settings_writer.cpp"] + [
    f"src/support/{name}.cpp"
    for name in ("run_lock", "target_hold", "session_hold", "disk_look", "locks", "format_semaphore", "temp_file", "files", "shell_text")
] + [f"platform/sysaux/{name}.cpp" for name in ("content", "probe", "partitions", "disk_table", "copies")] + [
    f"src/tree/{name}.cpp" for name in ("slots", "slot_reads", "half_made", "state", "entry")
] + [f"src/tasks/{name}.cpp" for name in ("format", "remove", "connect", "recover", "repair", "add", "status", "whole_target")] + [
    f"src/iscsi/{name}.cpp" for name in ("session", "node", "iscsiadm", "settings_daemon")
] + ["src/volume/session_volumes.cpp", "src/upgrade/remvol_ver_upgrade.cpp", "platform/events/recovery.cpp",
     "platform/events/targets.cpp", "platform/ktree/service.cpp", "platform/ktree/endpoint.cpp", "src/frontend/options.cpp",
     "src/frontend/log.cpp", "src/frontend/main.cpp"]

SWAPS = {
    "and for or": [(" || ", " && "), (" && ", " || ")],
    "comparison": [(" == ", " != "), (" != ", " == "), (" < ", " <= "), (" <= ", " < "), (" > ", " >= "),
                   (" >= ", " > ")],
    "returned value": [("return true;", "return false;"), ("return false;", "return true;"),
                       ("return kOk;", "return kFailed;"), ("return kFailed;", "return kOk;"),
                       ("return 0;", "return -1;"), ("return -1;", "return 0;"), ("return nullptr;", "return {};")],
    "sum": [(" + 1", ""), (" - 1", ""), ("++", "--"), (" += ", " = ")],
}
FLAG = re.compile(r"\b(?:[A-Z][A-Z0-9]*_[A-Z0-9_]+) \| | \| [A-Z][A-Z0-9]*_[A-Z0-9_]+\b")
CONSTANT = re.compile(r"^\s*(?:static )?constexpr [\w:]+ k\w+ = (\d+);")
CONDITION = re.compile(r"^\s*(?:\} else )?(?:if|while) \((.*)\)(?: \{| [^()].*;)?$|^\s*return (.+) \? .*;$")
CALL = re.compile(r"^\s*(?:[\w.>-]+::)*[\w.]+(?:->\w+)?\(.*\);$")
LEAVE = re.compile(r"^\s*(?:if \(.*\) )?(?:return\b.*|break|continue);$")
GUARDED = re.compile(r"^(\s*if \(.*\)) ((?:[\w]+::)*[\w.]+(?:->\w+)?\(.*\);)$")
TERNARY = re.compile(r"^(\s*(?:return|.* =)) (.+) \? (.+) : (.+);$")


@dataclasses.dataclass(frozen=True)
class Breakage:
    file: str
    line: int  # from 1
    before: str
    after: str
    kind: str
    reason: str = ""
    tests: tuple = ()

    def key(self):
        return (self.file, self.before.strip(), self.after.strip())

    def __str__(self):
        return f"{self.file}:{self.line} ({self.kind})\n  - {self.before.strip()}\n  + {self.after.strip()}"


def masked(line):
    """The line with the insides of texts and the comment blotted out, as long as before."""
    line = re.sub(r'"(?:[^"\\]|\\.)*"', lambda m: '"' + "~" * (len(m[0]) - 2) + '"', line)
    line = re.sub(r"'(?:[^'\\]|\\.)+'", lambda m: "'" + "~" * (len(m[0]) - 2) + "'", line)
    return re.sub(r"//.*", lambda m: "~" * len(m[0]), line)


def is_balanced(text):
    depth = 0
    for character in text:
        depth += (character == "(") - (character == ")")
        if depth < 0:
            return False
    return depth == 0


def operand_ends(plain, at, length):
    """Where the operand after an operator ends: at a bracket or operator of its own level."""
    depth, end = 0, at + length
    while end < len(plain):
        if depth == 0 and (plain[end] in ");," or plain.startswith((" && ", " || ", " ? "), end)):
            return end
        depth += (plain[end] in "([{") - (plain[end] in ")]}")
        end += 1
    return end


def broken_lines(lines, number):
    """Yields (kind, new line) for every breakage of the line."""
    line = lines[number]
    plain = masked(line)
    if not plain.strip("~ ") or re.match(r"\s*(#|//|static_assert|template|using |namespace|\})", plain) and "} else" not in plain:
        return
    if plain.lstrip().startswith("LOG"):  # what it says may vary, but not whether
        yield from dropped_statements(lines, number, plain)
        return
    for kind, swaps in SWAPS.items():
        for old, new in swaps:
            at = plain.find(old)
            while at >= 0:
                yield kind, line[:at] + new + line[at + len(old):]
                at = plain.find(old, at + len(old))
    for operator in (" && ", " || "):
        at = plain.find(operator)
        while at >= 0:
            yield "condition dropped", line[:at] + line[operand_ends(plain, at, len(operator)):]
            at = plain.find(operator, at + len(operator))
    for flag in FLAG.finditer(plain.replace("O_RDONLY", "0_______")):  # which is 0
        yield "flag dropped", line[:flag.start()] + line[flag.end():]
    constant = CONSTANT.match(plain)
    if constant:
        start, end = constant.span(1)
        yield "constant moved", f"{line[:start]}{int(constant[1]) + 1}{line[end:]}"
        if constant[1] != "0":
            yield "constant moved", f"{line[:start]}0{line[end:]}"
    condition = CONDITION.match(plain)
    if condition:
        group = 1 if condition[1] is not None else 2
        start, end = condition.span(group)
        inside = plain[start:end]
        if group == 1 and not is_balanced(inside):  # the statement behind it has brackets too
            end = start + closing(inside)
            inside = plain[start:end]
        if is_balanced(inside) and inside and ";" not in inside and not re.search(r"\w [*&]?\w+ = ", inside):
            yield "condition turned round", f"{line[:start]}!({line[start:end]}){line[end:]}"
    yield from dropped_statements(lines, number, plain)
    choice = TERNARY.match(plain)
    if choice:
        head = line[:choice.end(1)]
        yield "one branch", f"{head} {line[choice.start(3):choice.end(3)]};"
        yield "one branch", f"{head} {line[choice.start(4):choice.end(4)]};"


def closing(text):
    depth = 0
    for at, character in enumerate(text):
        depth += (character == "(") - (character == ")")
        if depth < 0:
            return at
    return 0


def dropped_statements(lines, number, plain):
    line = lines[number]
    space = line[: len(line) - len(line.lstrip())]
    begins = number > 0 and re.search(r"[;{}:]\s*(~*)$|^\s*~*$|\)$|else$", masked(lines[number - 1]))
    if not begins or not is_balanced(plain):
        return
    if LEAVE.match(plain):
        ends_function = number + 1 < len(lines) and lines[number + 1].startswith("}")
        if ends_function and plain.lstrip().startswith("return "):
            return  # a function without a value has no meaning
        yield "leaving dropped", f"{space};"
    elif GUARDED.match(plain):
        yield "call left out", f"{space};"
        match = GUARDED.match(plain)
        yield "condition left out", f"{space}{line[match.start(2):]}"
    elif CALL.match(plain) and not re.match(r"\s*LOG(_AT)?\((caller, )?[1-9]", line) and not plain.strip().startswith("if"):
        yield "call left out", f"{space};"


def all_breakages(root, only=""):
    found = []
    for name in SCOPE:
        if only not in name:
            continue
        lines = (root / name).read_text().split("\n")
        seen = set()
        for number, line in enumerate(lines):
            for kind, after in broken_lines(lines, number):
                if after != line and (number, after) not in seen:
                    seen.add((number, after))
                    found.append(Breakage(name, number + 1, line, after, kind))
    return found


def chosen(root, count, seed, only=""):
    """`count` of them, the same for a seed as long as their lines stay as they are, at most one a line, in the
    order of danger."""
    def rank(breakage):
        return hashlib.sha256("\0".join((str(seed), breakage.kind, *breakage.key())).encode()).hexdigest()

    taken, lines = [], set()
    for breakage in sorted(all_breakages(root, only), key=rank):
        if len(taken) == count:
            break
        if (breakage.file, breakage.line) not in lines:
            lines.add((breakage.file, breakage.line))
            taken.append(breakage)
    return sorted(taken, key=lambda b: (SCOPE.index(b.file), b.line))


def stored(path, root, complain):
    """The breakages of a file: blocks of "FILE", "- line", "+ line", "= reason", "@ tests"; see tests/mutate/known.
    Calls complain(text) for each whose line is there no more."""
    found = []
    for block in re.split(r"\n\s*\n", pathlib.Path(path).read_text()):
        parts = [line for line in block.split("\n") if line and not line.startswith("#")]
        if not parts:
            continue
        texts = {mark: " ".join(p[2:].strip() for p in parts[1:] if p[0] == mark) for mark in "-+=@"}
        lines = (root / parts[0]).read_text().split("\n")
        places = [n for n, line in enumerate(lines) if line.strip() == texts["-"]]
        if not places:
            complain(f"{path}: {parts[0]} has no line '{texts['-']}' any more")
            continue
        line = lines[places[0]]
        space = line[: len(line) - len(line.lstrip())]
        found.append(Breakage(parts[0], places[0] + 1, line, space + texts["+"], "known", texts["="],
                              tuple(texts["@"].split())))
    return found
