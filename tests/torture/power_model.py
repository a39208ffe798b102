"""What must be on the disks and in the tree after the power was cut, by what was asked for and what was answered.

A Model holds what was answered: the volumes that are stored, the targets that are to be connected, the files that were
synced. The steps that had begun and were not answered yet ("under way") may have taken effect or not.
"""

import copy
import dataclasses
import hashlib
import re
import xml.etree.ElementTree

from judge import INITIATOR, PASSING, slots

VOLUMES = {"a": (1, 1), "b b": (1, 2), "c$d": (2, 1)}  # share: target, LUN
NAME = "iqn.2026-01.org.example:t{}"
PERSISTED = ("add", "connect", "disconnect", "format", "del", "del_lun")  # commands that copy the settings to the flash
WEIGHTS = {"write": 8, "format": 4, "del_lun": 3, "disconnect": 2, "del": 1, "connect": 1, "status": 1}
# Seconds that a command takes when the machine has a processor for itself.
SECONDS = {"init": 4.5, "add": 0.8, "connect": 5.5, "write": 0.2, "format": 4, "del_lun": 3, "disconnect": 3.5, "del": 3.5,
           "status": 0.5}


@dataclasses.dataclass
class Step:
    verb: str
    share: str = ""
    file: str = ""
    lines: int = 0
    poll: float = 0  # after so many seconds somebody else asks for the status

    @property
    def target(self):
        return VOLUMES[self.share][0] if self.share else 0

    @property
    def lun(self):
        return VOLUMES[self.share][1]

    @property
    def digest(self):
        return hashlib.md5(f"{self.share} {self.file}\n".encode() * self.lines).hexdigest()

    def line(self):
        """The command line of the appliance's shell."""
        if self.verb == "write":
            return f"keep '{self.share}' {self.file} '{self.share} {self.file}' {self.lines}"
        words = f"remvol --{self.verb}"
        if self.target:
            words += f" -n {NAME.format(self.target)}"
        if self.verb in ("add", "format", "del_lun"):
            words += f" -l {self.lun}"
        if self.verb == "add":
            words += f" -i 10.9.0.2 -p 3260 -s '{self.share}'"
        return f"(sleep {self.poll:.2f}; remvol --status) & {words}; status=$?; wait $!; (exit $status)" if self.poll else words

    def __str__(self):
        return " ".join(filter(None, [self.verb, f"'{self.share}'" if self.share else "", self.file]))


class Model:
    def __init__(self):
        self.present = set()  # shares
        self.wish = {1: False, 2: False}  # targets that are to be connected
        self.files = {share: {} for share in VOLUMES}  # name: digest; also of volumes that are not stored any more
        self.settings = (None, None)  # the settings file and its flash copy as last seen, None where there was none
        self.seen = True  # nothing was answered since then
        self.copied = False  # what was answered since then has made a new flash copy

    def choose(self, dice, number):
        """The next step; `number` tells its file from all others. The first steps bring a volume up and write to it: without a
        file there is little to lose."""
        opening = not any(self.files.values())
        share = next(iter(VOLUMES)) if opening else dice.choice(list(VOLUMES))
        if share not in self.present:
            verb = "add"
        elif not self.wish[VOLUMES[share][0]]:
            verb = "connect"
        elif opening:
            verb = "write"
        else:
            verb = dice.choices(list(WEIGHTS), list(WEIGHTS.values()))[0]
        step = Step(verb, "" if verb == "status" else share)
        if verb == "write":
            step.file, step.lines = f"f{number}", dice.choice([1, 100, 5000, 40000])
        elif verb != "status" and dice.random() < 0.5:
            step.poll = round(dice.random() * SECONDS[verb], 2)
        return step

    def answered(self, step):
        """The step ended with 0."""
        if step.verb == "add":
            self.present.add(step.share)
        elif step.verb in ("connect", "disconnect"):
            self.wish[step.target] = step.verb == "connect"
        elif step.verb == "write":
            self.files[step.share][step.file] = step.digest
        elif step.verb == "format":
            self.files[step.share] = {}
        elif step.verb in ("del", "del_lun"):
            siblings = {share for share in self.present if VOLUMES[share][0] == step.target}
            gone = siblings if step.verb == "del" else {step.share}
            self.present -= gone
            if gone == siblings:
                self.wish[step.target] = False
        if step.verb != "write":
            self.seen = False
            self.copied = self.copied or step.verb in PERSISTED

    def saw(self, settings, step=None):
        """The settings file and its flash copy after a step ended. Returns what is wrong with them."""
        wrong = self.settings_findings(settings, [])
        if step and step.verb in PERSISTED and not step.poll and settings[0] != settings[1]:
            wrong.append(f"settings: the flash copy is not the settings file after '{step}'")
        self.settings, self.seen, self.copied = settings, True, False
        return wrong

    # ---- after a cut ----

    def outcomes(self, under_way):
        """What may be stored: the shares as they were, and as each step under way leaves them."""
        model, found = copy.deepcopy(self), [set(self.present)]
        for step in under_way:
            model.answered(step)
            found.append(set(model.present))
        return found

    def settings_findings(self, settings, under_way):
        """`settings`: the bytes of the settings file and of its flash copy after the cut."""
        writers = [step for step in under_way if step.verb != "write"]
        wrong = []
        stored = []
        for what, now, before in zip(("the settings file", "the flash copy"), settings, self.settings):
            copies = what == "the flash copy"
            if now == before and not (self.copied if copies else self.present and not self.seen):
                continue
            if now is None:
                wrong.append(f"settings: {what} is missing")
                continue
            if self.seen and not [step for step in writers if not copies or step.verb in PERSISTED]:
                wrong.append(f"settings: {what} changed although nothing was under way that writes it")
            try:
                shares = stored_shares(tree_of(now), under_way)
            except (xml.etree.ElementTree.ParseError, ValueError) as error:
                wrong.append(f"settings: {what} is not whole: {error}")
                continue
            stored.append(shares)
            if shares not in self.outcomes(writers):
                wrong.append(f"settings: {what} has the volumes {sorted(shares)}, "
                             f"not one of {[sorted(each) for each in self.outcomes(writers)]}")
        return wrong

    def kept_files(self, under_way):
        """The files that must be there: those of the volumes that nobody has begun to format since."""
        doubtful = {step.share for step in under_way if step.verb == "format"}
        return {share: files for share, files in self.files.items() if share not in doubtful}

    def file_findings(self, found, under_way):
        """`found`: {share: {name: digest}} of the volumes that were looked at."""
        wrong = []
        for share, files in self.kept_files(under_way).items():
            for name, digest in files.items() if share in found else ():
                if found[share].get(name) != digest:
                    wrong.append(f"lost: the synced file {name} of '{share}' is {found[share].get(name, 'not there')}")
        return wrong

    def running_findings(self, report, under_way):
        """`report`: the appliance after --init and --status."""
        wrong = []
        targets = slots(report.tree)
        for key, number in (("count", len(targets)), ("total_lun_count", sum(len(luns) for _, luns in targets.values()))):
            if int(report.tree.get(f"{INITIATOR}/{key}", 0)) != number:
                wrong.append(f"count: {key} is {report.tree.get(f'{INITIATOR}/{key}')}, and {number} are stored")
        adding = {step.target for step in under_way if step.verb == "add"}
        try:
            stored = stored_shares(report.tree, [])
            if stored not in self.outcomes(under_way):
                wrong.append(f"lost: stored are {sorted(stored)}")
        except ValueError as error:
            wrong.append(f"half-made: {error}")
        for n, (keys, luns) in targets.items():
            t = int(keys.get("target", "0")[-1])
            wished = keys.get("conn_set") == "1"
            if t and wished != self.wish[t] and not any(step.target == t for step in under_way):
                wrong.append(f"lost: t{t} is {'' if wished else 'not '}to be connected")
            if keys.get("status") != ("Connected" if wished else "Disconnected"):
                wrong.append(f"stale: t{t} says {keys.get('status')} with conn_set {keys.get('conn_set')}")
            if not luns and t not in adding:
                wrong.append(f"half-made: t{t} has no LUN")
            for lun in luns.values():
                wrong += self.lun_findings(lun, wished, report, under_way)
        if report.witness != WITNESS:
            wrong.append("foreign-disk: the LUN that no command names has changed")
        return wrong + self.file_findings({share: report.files.get(share, {}) for share in report.mounted}, under_way)

    def lun_findings(self, lun, wished, report, under_way):
        share, status = lun.get("share"), lun.get("status", "")
        if PASSING.match(status):
            return [f"stale: '{share}' says {status}"]
        if (share in report.mounted) != (status == "Running"):
            return [f"stale: '{share}' says {status} and is {'' if share in report.mounted else 'not '}mounted"]
        if (status == "Running") == wished:
            return []
        if wished and self.may_be_unformatted(share, under_way):
            return []
        return [f"lost: '{share}' is {status}"]

    def may_be_unformatted(self, share, under_way):
        """The power went while the volume was formatted for the first time or anew."""
        begun = [step for step in under_way if step.share == share or step.verb in ("connect", "init")]
        return share in VOLUMES and bool(begun) and not self.kept_files(under_way).get(share)

    def adopt(self, report):
        """What is found after a cut is what the next steps begin with."""
        self.seen = False
        self.present = stored_shares(report.tree, [])
        self.wish = dict.fromkeys(self.wish, False)
        for keys, _ in slots(report.tree).values():
            self.wish[int(keys["target"][-1])] = keys.get("conn_set") == "1"
        for share in report.mounted:
            self.files[share] = {name: digest for name, digest in self.files[share].items()
                                 if report.files.get(share, {}).get(name) == digest}


WITNESS = hashlib.md5((b"somebody else's\n" * (1 << 17))[: 2 << 20]).hexdigest()


class Report:
    """The answer of the appliance's "report"."""

    def __init__(self, text):
        self.tree, self.files, self.mounted, self.witness = {}, {}, set(), ""
        for line in text.splitlines():
            if line.startswith("/"):
                path, _, value = line.partition("=")
                self.tree[path] = value
            elif fit := re.match(r"([0-9a-f]{32})  /data/luns/", line):
                self.witness = fit[1]
            elif fit := re.match(r"([0-9a-f]{32})  /mnt/VV/([^/]+)/(.+)", line):
                self.files.setdefault(fit[2], {})[fit[3]] = fit[1]
            elif fit := re.match(r"mount \S+ /mnt/VV/(.+)", line):
                self.mounted.add(fit[1])


def tree_of(settings):
    """{path: value} of a settings file, as ktreec -t prints it."""
    tree = {}

    def walk(element, path):
        if element.text and element.text.strip() or not len(element):
            tree[path] = element.text or ""
        counts = {}
        for child in element:
            counts[child.tag] = counts.get(child.tag, 0) + 1
            number = f":{counts[child.tag]}" if child.tag == "id" or counts[child.tag] > 1 else ""
            walk(child, f"{path}/{child.tag}{number}")

    root = xml.etree.ElementTree.fromstring(settings)
    if root.tag != "config":
        raise ValueError(f"its root is {root.tag}")
    walk(root, "")
    return tree


def stored_shares(tree, under_way):
    """The shares that are stored; ValueError when one is not the volume's that it was given to. What a step under way had
    not yet filled in when somebody asked for the status is left out."""
    found = set()
    for n, (keys, luns) in slots(tree).items():
        for lun in luns.values():
            share = lun.get("share")
            if not under_way and (not keys.get("target") or not keys.get("ip") or not share):
                raise ValueError(f"slot {n} has {keys} and {lun}")
            if share and keys.get("target"):
                wanted = {"target": NAME.format(VOLUMES[share][0]), "ip": "10.9.0.2", "port": "3260"}
                if {key: keys.get(key) for key in wanted} != wanted or lun.get("lun") != str(VOLUMES[share][1]):
                    raise ValueError(f"'{share}' is stored as {keys}, {lun}")
                if share in found:
                    raise ValueError(f"'{share}' is stored twice")
                found.add(share)
    return found
