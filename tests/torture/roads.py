"""The roads of `faults`: a beginning, a command, and what a person would do when it has to be done again."""

import dataclasses
import xml.etree.ElementTree as xml

from pairs import BLANK, EMPTY, FULL, on, stored
from world import after_boot

FOUND = "/tmp/found.xml"  # where a search puts what it has found


def held_disks(world):
    """All have data, and nobody is logged in."""
    stored(world, (1, 0), (1, 1), (2, 0), (3, 0), connect=(1, 2))
    for t in (1, 2):
        world.tool("disconnect", t=t)


HELD = ("held", held_disks)


# --- what a machine may find at its start: of a beginning's settings and flash copy ---

def booted(settings, flash):
    return settings, flash


def empty_settings(_, flash):
    return b"", flash


def no_settings(_, flash):
    return None, flash


def old_settings(settings, _):
    """As the version before wrote them: one LUN for each target, and nobody named it."""
    root = xml.fromstring(settings)
    initiator = root.find("iscsi/initiator")
    for name in ("ver", "total_lun_count"):
        initiator.remove(initiator.find(name))
    for target in initiator.findall("id"):
        luns = target.find("lun")
        first = luns.find("id")
        for name in ("share", "format_state", "format_progress", "volume_state"):
            target.extend(first.findall(name))
        target.remove(luns)
    return xml.tostring(root, encoding="UTF-8", xml_declaration=True), None


@dataclasses.dataclass
class Road:
    name: str
    furnish: tuple
    command: tuple
    before: tuple = ()  # commands that belong to it and go before it, also when it is repeated
    heal: tuple = ()  # what a person would do next, when the repetition is refused as it must be
    degraded: str = ""  # a share whose volume turns read-only first
    boots: object = None  # the machine has just been started, and finds these settings
    unit: bool = True  # the tree's daemon runs; else it is the command's to start it
    ends_tree: bool = False
    status: int = 0  # of a run without a fault

    def beginning(self, snapshot):
        if self.boots is None:
            return snapshot
        settings, flash, state, _ = snapshot
        return (*self.boots(settings, flash), after_boot(state), [])


CONNECT_1, CONNECT_2, CONNECT_3 = ("connect", on(1)), ("connect", on(2)), ("connect", on(3))
INIT, DEINIT, SYSTEM_OFF = ("init", {}), ("deinit", {}), ("system_off", {})
EVENT_1, EVENT_3 = ("oiscsi_evt_reopen", on(1)), ("oiscsi_evt_reopen", on(3))
MOVED_3 = {"t": 3, "i": "10.9.0.3", "p": 3261}


def changed(t):
    """What --modify stores anew: other secrets than the target's --add, which the made-up target takes as well."""
    return {"t": t, "U": f"user{t}x", "P": f"secret{t}secret{t}x"}


def searching(t):
    return {"t": t, "i": f"10.9.0.{t}", "p": 3260, "o": FOUND}


# A login of a start-up that shows no disk is for ever: the target is not wanted any more, until somebody connects it.
WANTED_AGAIN = (CONNECT_1, CONNECT_2)

ROADS = {
    road.name: road
    for road in (
        Road("init", FULL, INIT),
        Road("init-boot", FULL, INIT, boots=booted, heal=WANTED_AGAIN),
        Road("init-alone", FULL, INIT, boots=booted, unit=False, heal=WANTED_AGAIN),
        Road("init-empty", FULL, INIT, boots=empty_settings, unit=False, heal=WANTED_AGAIN),
        Road("init-flash", FULL, INIT, boots=no_settings, unit=False, heal=WANTED_AGAIN),
        Road("init-old", FULL, INIT, boots=old_settings, heal=WANTED_AGAIN),
        Road("add", FULL, ("add", on(4, 0, "v40")), heal=(("connect", on(4)),)),
        Road("add-first", EMPTY, ("add", on(1, 0, "v10")), heal=(CONNECT_1,)),
        Road("add-second", HELD, ("add", on(2, 1, "v21")), heal=(CONNECT_2,)),
        Road("add-connected", FULL, ("add", on(2, 1, "v21")), heal=(CONNECT_2,)),
        Road("connect", BLANK, CONNECT_1),
        Road("connect-again", FULL, CONNECT_1),
        Road("connect-held", HELD, CONNECT_1),
        Road("disconnect", FULL, ("disconnect", on(1))),
        Road("disconnect-all", FULL, ("disconnect", {})),
        Road("del", FULL, ("del", on(1))),
        Road("del_lun", FULL, ("del_lun", on(1, 0))),
        Road("del_lun-last", FULL, ("del_lun", on(2, 0))),
        Road("format", FULL, ("format", on(1, 0)), heal=(CONNECT_1,)),
        Road("format-foreign", FULL, ("format", on(1, 0)), before=(CONNECT_2,), boots=booted, heal=(CONNECT_1,), status=255),
        Road("disconnect-foreign", FULL, ("disconnect", on(1)), before=(CONNECT_2,), boots=booted),
        Road("del-foreign", FULL, ("del", on(1)), before=(CONNECT_2,), boots=booted),
        Road("modify", FULL, ("modify", changed(1)), heal=(CONNECT_1,)),
        Road("modify-stored", HELD, ("modify", changed(3)), heal=(CONNECT_3,)),
        Road("modify_address", FULL, ("modify_address", MOVED_3), heal=(CONNECT_3,)),
        Road("status", FULL, ("status", {})),
        Road("status-boot", FULL, ("status", {}), boots=booted, heal=(INIT,)),
        Road("check_share_name", FULL, ("check_share_name", on(share="v20")), status=1),
        Road("search", FULL, ("search", {"i": "10.9.0.1", "p": 3260, "o": FOUND})),
        Road("search_lun", FULL, ("search_lun", searching(1))),
        Road("search_lun-stored", FULL, ("search_lun", searching(3))),
        Road("search_lun-foreign", FULL, ("search_lun", searching(5))),
        Road("reopen", FULL, EVENT_1, heal=(("oiscsi_evt_recover", on(1)),)),
        Road("recover", FULL, ("oiscsi_evt_recover", on(1)), before=(EVENT_1,), heal=(CONNECT_1,), degraded="v10"),
        Road("recover-well", FULL, ("oiscsi_evt_recover", on(1)), before=(EVENT_1,), heal=(CONNECT_1,)),
        Road("deinit", FULL, DEINIT, heal=(INIT,), ends_tree=True),
        Road("system_off", FULL, SYSTEM_OFF, heal=(INIT,), ends_tree=True),
    )
}
