"""What must hold of the tree, the settings file and the disks once every run has ended and `--status` has run."""

import re

from world import FLASH, INITIATOR, LUNS, NAME, SAVED, TARGETS

PASSING = re.compile(r"^(Formatting|Wait to Format|Connecting|Creating Volume)")
SLOT = re.compile(rf"^{INITIATOR}/id:(\d+)/(?:lun/id:(\d+)/)?([a-z_/]+)$")


def slots(tree):
    """{slot: ({key: value}, {LUN slot: {key: value}})} of the targets."""
    found = {}
    for path, value in tree.items():
        fit = SLOT.match(path)
        if fit:
            keys, luns = found.setdefault(int(fit[1]), ({}, {}))
            (keys if fit[2] is None else luns.setdefault(int(fit[2]), {}))[fit[3]] = value
    return found


def volumes(tree):
    """{(target, LUN): (share, slot, LUN slot)}, by what the slots say."""
    found = {}
    for n, (keys, luns) in slots(tree).items():
        fit = re.fullmatch(NAME.format(r"(\d+)").replace(".", r"\."), keys.get("target", ""))
        for m, lun in luns.items():
            if fit and lun.get("lun", "").isdigit():
                found[int(fit[1]), int(lun["lun"])] = (lun.get("share"), n, m)
    return found


def tree_findings(tree, state, offered_shares, unfinished=()):
    """`offered_shares`: {(target, LUN): every share name with which it was ever to be added}; `unfinished`: targets
    that may be without a LUN."""
    wrong = []
    found = slots(tree)
    names, shares = {}, {}
    for n, (keys, luns) in sorted(found.items()):
        where = f"slot {n}"
        fit = re.fullmatch(r".*:t(\d+)", keys.get("target", ""))
        if not fit:
            wrong.append(f"half-made: {where} has no target: {keys}")
            continue
        t = int(fit[1])
        where += f" (t{t})"
        if t in names:
            wrong.append(f"doubled: t{t} is in slots {names[t]} and {n}")
        names[t] = n
        if not keys.get("ip"):
            wrong.append(f"half-made: {where} has no address")
        for key, value in {"ip": f"10.9.0.{t}", "port": "3260", "chap": "1", "chap_name": f"user{t}",
                           "chap_pwd": f"secret{t}secret{t}"}.items():
            if keys.get(key, value) != value:
                wrong.append(f"foreign-value: {where} has {key}={keys[key]}")
        if PASSING.match(keys.get("status", "")):
            wrong.append(f"stale: {where} says {keys['status']}")
        # "Reconnecting" stays until a recovery ends, whatever the session does.
        if keys.get("status") != "Reconnecting" and (keys.get("status") == "Connected") != bool(state[t][0]):
            wrong.append(f"untrue: {where} says {keys.get('status')}, its session is {'there' if state[t][0] else 'not there'}")
        if not luns and t not in unfinished:
            wrong.append(f"half-made: {where} has no LUN")
        if keys.get("lun/count", "0") != str(len(luns)):
            wrong.append(f"count: {where} has lun/count={keys.get('lun/count')} and {len(luns)} LUNs")
        wrong += lun_findings(where, t, luns, state, shares, offered_shares)
    total = sum(len(luns) for _, luns in found.values())
    # An add that is refused after it made the target leaves the count to the next change.
    bare = sum(not luns for _, luns in found.values())
    for key, least, number in (("count", len(found) - bare, len(found)), ("total_lun_count", total, total)):
        if not least <= int(tree.get(f"{INITIATOR}/{key}", "0")) <= number:
            wrong.append(f"count: {key}={tree.get(f'{INITIATOR}/{key}')} and {number} in the tree")
    if len(found) > TARGETS or total > LUNS:
        wrong.append(f"count: {len(found)} targets, {total} LUNs")
    return wrong


def lun_findings(where, t, luns, state, shares, offered_shares):
    wrong, numbers = [], {}
    for m, lun in sorted(luns.items()):
        here = f"{where} LUN slot {m}"
        if not lun.get("lun", "").isdigit() or not lun.get("share") or lun.get("enable") != "1":
            wrong.append(f"half-made: {here}: {lun}")
            continue
        number, share = int(lun["lun"]), lun["share"]
        if number in numbers:
            wrong.append(f"doubled: {here} and slot {numbers[number]} are both LUN {number}")
        numbers[number] = m
        if share in shares:
            wrong.append(f"doubled: the share {share} is of {here} and of {shares[share]}")
        shares[share] = here
        if offered_shares is not None and share not in offered_shares.get((t, number), ()):
            wrong.append(f"foreign-value: {here}, LUN {number}, has the share {share}, which nobody gave it")
        dev = state[t][3][number].dev
        if lun.get("dev", "") != dev and (state[t][0] or any(s[0] for s in state.values())):
            wrong.append(f"foreign-value: {here} has dev={lun.get('dev')}, its disk is '{dev}'")
        if lun.get("mnt") and lun["mnt"] != f"/mnt/VV/{share}":
            wrong.append(f"foreign-value: {here}, share {share}, has mnt={lun['mnt']}")
        if PASSING.match(lun.get("status", "")):
            wrong.append(f"stale: {here} says {lun['status']}")
    return wrong


def disk_findings(world):
    """Every mounted volume is whole, at its own place, from its own disk."""
    wrong, state = [], world.state()
    known = {share: key for key, (share, _, _) in volumes(world.tree()).items()}
    for point, sources in world.mounts().items():
        share = point.rsplit("/", 1)[1]
        if len(sources) > 1:
            wrong.append(f"mounted-twice: {point} from {sources}")
        mark = world.mark(point)
        if mark is None:
            wrong.append(f"files-lost: the files of the volume at {point} are gone")
            continue
        t, l, stamp = mark
        lun = state[t][3][l]
        if not lun.dev:
            wrong.append(f"pulled: {point} is mounted from {sources[-1]}, and t{t} has no session")
        elif f"/dev/{lun.dev}1" != sources[-1] or stamp != lun.stamp:
            wrong.append(f"data-lost: {point} shows data {stamp} of t{t} LUN {l} from {sources[-1]}; the LUN is {lun.dev} with {lun.stamp}")
        if share in known and known[share] != (t, l):
            wrong.append(f"foreign-disk: the share {share} is of {known[share]} and shows t{t} LUN {l}")
        if share not in known:
            wrong.append(f"left-over: {point} is mounted and no slot has it")
    for name in world.folders():
        if f"/mnt/VV/{name}" not in world.mounts():
            wrong.append(f"left-over: the folder {name} in /mnt/VV without a mount")
    return wrong


def settings_findings(world):
    """The settings file and its flash copy are whole, and the file is the tree."""
    wrong, settings = [], world.settings()
    for file in (SAVED, FLASH):
        if file not in settings:
            wrong.append(f"settings: no {file}")
            continue
        error, lines = settings[file]
        if error:
            wrong.append(f"settings: {file} cannot be loaded: {error}")
        elif file == SAVED and sorted(lines) != sorted(world.tree_lines()):
            wrong.append("settings: the file is not the tree, although --status wrote it last")
    return wrong


def lock_findings(world):
    """Nothing blocks: the format semaphore is gone, or free (a run that was killed leaves it so)."""
    value = world.semaphore()
    return [f"left-over: the format semaphore stands at {value} and nobody runs"] if value not in ("", "1") else []
