"""Two commands beside each other, again and again, begun at every distance from each other."""

import random

from many import Round
from world import World

_beginnings = {}


def beginning(name, furnish):
    """The state in which every round of a pair begins, made once by the tool itself."""
    if name not in _beginnings:
        with World(pace=20) as world:
            furnish(world)
            bad = [str(job) for job in world.jobs if job.status != 0] + world.findings()
            if bad:
                raise RuntimeError(f"the beginning failed: {bad}")
            _beginnings[name] = (world.snapshot(), [job for job in world.jobs if job.command == "add"])
    return _beginnings[name]


def stored(world, *adds, connect=()):
    """Targets 1 to 4 offer LUNs 0 to 2; `adds` are (target, LUN)."""
    world.offer({t: [0, 1, 2] for t in range(1, 9)})
    world.tool("init")
    for t, l in adds:
        world.tool("add", t=t, l=l, share=f"v{t}{l}")
    for t in connect:
        world.tool("connect", t=t)


class Pair(Round):
    """One round: `first` and `second` are (command, options); the second begins `distance` seconds after the first."""

    def __init__(self, begin, first, second, distance, polls=0):
        self.begin, self.first, self.second, self.distance, self.polls = begin, first, second, distance, polls
        self.seed, self.dice, self.downtimes, self.findings = None, random.Random(0), [], []

    def play(self, expect=None):
        snapshot, adds = self.begin
        with World(daemon=False) as self.world:
            self.world.restore(snapshot)
            self.world.start_daemon()
            self.world.jobs += adds
            jobs = self.run()
            self.world.settle()
            if expect:
                self.findings += expect(*jobs) or []
            self.after()
            found = self.findings + self.world.findings()
            if found:
                self.record()
        return found

    def run(self):
        order = [self.first, self.second] if self.distance >= 0 else [self.second, self.first]
        jobs = [self.world.begin(order[0][0], **order[0][1])]
        self.world.pump(abs(self.distance))
        jobs.append(self.world.begin(order[1][0], **order[1][1]))
        for _ in range(self.polls):
            self.world.pump(0.03)
            self.world.begin("status")
        return jobs if self.distance >= 0 else jobs[::-1]


# --- the pairs: where they begin, the two commands, what their results must be, how often --status is asked for ---

BLANK = ("blank", lambda world: stored(world, (1, 0), (1, 1), (2, 0)))
FULL = ("full", lambda world: stored(world, (1, 0), (1, 1), (2, 0), (3, 0), connect=(1, 2)))
THREE = ("three", lambda world: stored(world, (1, 0), (1, 1), (1, 2), connect=(1,)))
EMPTY = ("empty", lambda world: stored(world))


def both_work(one, two):
    return [f"refused: {job}: {job.output[-600:]}" for job in (one, two) if job.status != 0]


def one_works(one, two):
    return [] if sorted([one.status, two.status]) == [0, 255] else [f"not-one: {one}, {two}"]


def anything(*_):
    return []


def on(t=None, l=None, share=None):
    return {key: value for key, value in (("t", t), ("l", l), ("share", share)) if value is not None}


def add(t, l, share=None):
    return ("add", on(t, l, share or f"v{t}{l}"))


PAIRS = {
    "connect-connect": (BLANK, ("connect", on(1)), ("connect", on(1)), both_work),
    "connect-connect-of-two-targets": (BLANK, ("connect", on(1)), ("connect", on(2)), both_work),
    "connect-connect-mounted": (FULL, ("connect", on(1)), ("connect", on(1)), both_work),
    "format-connect": (FULL, ("format", on(1, 0)), ("connect", on(1)), both_work),
    "format-format": (FULL, ("format", on(1, 0)), ("format", on(1, 0)), anything),
    "format-format-of-two-luns": (FULL, ("format", on(1, 0)), ("format", on(1, 1)), both_work),
    "format-format-of-two-targets": (FULL, ("format", on(1, 0)), ("format", on(2, 0)), both_work),
    "init-connect": (FULL, ("init", {}), ("connect", on(3)), both_work),
    "init-connect-blank": (BLANK, ("init", {}), ("connect", on(1)), both_work),
    "init-status": (FULL, ("init", {}), ("status", {}), both_work),
    "del-status": (FULL, ("del", on(1)), ("status", {}), both_work),
    "del-connect-of-another": (FULL, ("del", on(1)), ("connect", on(3)), both_work),
    "del-format-of-another": (FULL, ("del", on(1)), ("format", on(2, 0)), both_work),
    "del-connect": (BLANK, ("del", on(1)), ("connect", on(1)), anything),
    "del-add": (FULL, ("del", on(1)), add(4, 0), both_work),
    "del-add-same": (FULL, ("del", on(1)), add(1, 2), anything),
    "del-del": (FULL, ("del", on(1)), ("del", on(2)), both_work),
    "del-del-same": (FULL, ("del", on(1)), ("del", on(1)), anything),
    "del-del_lun": (FULL, ("del", on(1)), ("del_lun", on(1, 1)), anything),
    "del_lun-del_lun": (FULL, ("del_lun", on(1, 0)), ("del_lun", on(1, 1)), both_work),
    "del_lun-del_lun-same": (THREE, ("del_lun", on(1, 0)), ("del_lun", on(1, 0)), anything),
    "del_lun-connect": (BLANK, ("del_lun", on(1, 0)), ("connect", on(1)), anything),
    "del_lun-status": (FULL, ("del_lun", on(1, 0)), ("status", {}), both_work),
    "del_lun-format-of-the-next": (FULL, ("del_lun", on(1, 0)), ("format", on(1, 1)), both_work),
    "add-add": (EMPTY, add(1, 0), add(2, 0), both_work),
    "add-add-of-two-luns": (EMPTY, add(1, 0), add(1, 1), both_work),
    "add-add-of-two-luns-connected": (FULL, add(2, 1), add(2, 2), both_work),
    "add-add-same-share": (EMPTY, add(1, 0, "c1"), add(2, 0, "c1"), one_works),
    "add-add-same-lun": (EMPTY, add(1, 0, "c1"), add(1, 0, "c2"), one_works),
    "add-status": (FULL, add(4, 0), ("status", {}), both_work),
    "add-connect": (BLANK, add(1, 2), ("connect", on(1)), both_work),
    "add-del_lun-of-the-last": (FULL, add(3, 1), ("del_lun", on(3, 0)), both_work),
    "add-del_lun-of-another": (FULL, add(4, 0), ("del_lun", on(1, 0)), both_work),
    "connect-disconnect": (BLANK, ("connect", on(1)), ("disconnect", on(1)), anything),
    "connect-disconnect-all": (FULL, ("connect", on(3)), ("disconnect", {}), anything),
    "connect-disconnect-all-mounted": (FULL, ("connect", on(1)), ("disconnect", {}), anything),
    "connect-disconnect-all-blank": (BLANK, ("connect", on(1)), ("disconnect", {}), anything),
    "add-disconnect-all": (FULL, add(2, 1), ("disconnect", {}), anything),
    "format-disconnect-all": (FULL, ("format", on(1, 0)), ("disconnect", {}), anything),
    "modify-disconnect-all": (FULL, ("modify", on(1)), ("disconnect", {}), anything),
    "disconnect-all-twice": (FULL, ("disconnect", {}), ("disconnect", {}), anything),
    "connect-modify": (BLANK, ("connect", on(1)), ("modify", on(1)), anything),
    "connect-recover": (FULL, ("connect", on(1)), ("oiscsi_evt_recover", on(1)), both_work),
    "modify-modify": (FULL, ("modify", on(1)), ("modify", on(1)), anything),
    "modify-status": (FULL, ("modify", on(1)), ("status", {}), both_work),
    "disconnect-format": (FULL, ("disconnect", on(1)), ("format", on(1, 0)), anything),
    "disconnect-disconnect": (FULL, ("disconnect", on(1)), ("disconnect", {}), anything),
    "status-status": (FULL, ("status", {}), ("status", {}), both_work),
    "connect-polled": (BLANK, ("connect", on(1)), ("status", {}), both_work, 20),
    "connect-polled-mounted": (FULL, ("connect", on(3)), ("status", {}), both_work, 20),
    "format-polled": (FULL, ("format", on(1, 0)), ("status", {}), both_work, 20),
}


def torment(pair, *, rounds, spread=0.3, seed=1, stories=None):
    """Plays the rounds of a pair; gives {distance: findings} of those with any."""
    (name, furnish), first, second, expect, *polls = pair
    dice = random.Random(seed)
    begin = beginning(name, furnish)
    bad = {}
    for number in range(rounds):
        distance = round(dice.choice([1, 0.3, 0.1]) * dice.uniform(-spread, spread), 4)
        play = Pair(begin, first, second, distance, polls[0] if polls else 0)
        found = play.play(expect)
        if found:
            bad[distance] = found
            if stories:
                stories.mkdir(parents=True, exist_ok=True)
                (stories / f"{number}.txt").write_text("\n".join(found) + "\n\n" + play.story)
    return bad
