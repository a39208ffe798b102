import os
import pathlib
import sys

import pytest

sys.path.insert(0, str(pathlib.Path(__file__).parent))

from appliance import Site  # noqa: E402
from harness import Box, build_folder, machine_folder  # noqa: E402
from harness.traces import record_outside  # noqa: E402


def pytest_configure(config):
    record_outside()
    config.addinivalue_line("markers", "unsanitized: says nothing about a build with sanitizers, and is left out there")
    config.addinivalue_line("markers", "native: is left out where the programs are emulated (docs/lab.md)")
    config.addinivalue_line("markers", "long: waits for many seconds, and starts early so that nothing waits for it")


def pytest_addoption(parser):
    parser.addoption("--cases", type=choice, metavar="N[/EVERY[+FIRST]]",
                     help="of each test at most N cases: the first, the last, and some at equal distances between them; "
                          "of each EVERY tests one alone, beginning with the one behind FIRST others")


def choice(text):
    most, _, share = text.partition("/")
    every, _, first = share.partition("+")
    return int(most), int(every or 1), int(first or 0)


def leave_out(config, items, left_out):
    config.hook.pytest_deselected(items=[item for item in items if item in left_out])
    items[:] = [item for item in items if item not in left_out]


def not_chosen(items, most, every, first):
    """The tests beyond so many cases of one function, and all of the functions between those that are chosen."""
    cases = {}
    for item in items:
        cases.setdefault(item.nodeid.partition("[")[0], []).append(item)
    for place, same in enumerate(cases.values()):
        chosen = {i * (len(same) - 1) // max(most - 1, 1) for i in range(most)} if place % every == first else ()
        yield from (item for number, item in enumerate(same) if number not in chosen)


def spread_long(items):
    """Deals the long tests over the first quarter of all: pytest-xdist hands that out to begin with, to each worker one piece."""
    long = [item for item in items if item.get_closest_marker("long")]
    items[:] = [item for item in items if not item.get_closest_marker("long")]
    for place, item in enumerate(long):
        items.insert(place * max(len(items) // 4 // len(long), 1), item)


def pytest_collection_modifyitems(config, items):
    if config.getoption("--cases"):
        leave_out(config, items, set(not_chosen(items, *config.getoption("--cases"))))
    spread_long(items)
    if machine_folder() != build_folder():
        leave_out(config, items, {item for item in items if item.get_closest_marker("native")})
    if "REMVOL_SANITIZE:STRING=\n" in build_folder().joinpath("CMakeCache.txt").read_text():
        return
    leave_out(config, items, {item for item in items if item.get_closest_marker("unsanitized")})


@pytest.fixture
def bare_box():
    """A box without the tree's daemon."""
    if os.geteuid() != 0:
        pytest.skip("a box needs root")
    box = Box()
    yield box
    complaints = box.complaints()
    box.close()
    assert not complaints, "\n".join(complaints)


@pytest.fixture
def box(bare_box):
    """A box: see the text of the package harness."""
    bare_box.tree.start()
    return bare_box


@pytest.fixture
def site(box):
    """A box with targets: see the text of the module appliance."""
    return Site(box)


@pytest.fixture
def volume(site, box):
    """A site with a connected target and its mounted volume; a format does nothing."""
    site.store("iqn.t1", conn_set=1, conn_state=1,
               luns=[("data", 0, {"dev": "sdb", "mnt_dev": "/dev/sdb1", "mnt": "/mnt/VV/data"})])
    site.offer("iqn.t1", {0: "sdb"})
    site.log_in("iqn.t1")
    site.disk("sdb")
    site.mount("sdb", "/mnt/VV/data")
    box.fake("dd")
    box.fake("mke2fs")
    box.forget()
    return site
