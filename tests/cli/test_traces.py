"""The recorder of scripts/traces: what it writes down, and what the comparison says."""

import pathlib
import subprocess

import pytest

from harness import Box, traces

SCRIPT = pathlib.Path(__file__).parents[2] / "scripts/traces"


@pytest.fixture
def recorded(tmp_path, monkeypatch):
    """Gives a box whose trace is kept, and a function that ends the box and gives the lines."""
    monkeypatch.setattr(traces, "FOLDER", str(tmp_path))
    box = Box()
    box.tree.start()

    def lines():
        box.close()
        file, = (path for path in tmp_path.rglob("*") if path.is_file())
        return file.read_text().splitlines()

    return box, lines


def test_a_run_with_its_calls_its_output_and_the_tree(recorded):
    box, lines = recorded
    box.debug(1)
    box.hook("getaddrinfo", "nobody", ret=-2)
    box.remvol("--search", "-i", "nobody")
    found = lines()
    assert found[0] == "run: remvol --search -i nobody"
    assert found.index("  system winshare_reload") + 1 == found.index("    run winshare_reload |  | ")
    assert "  set /result/search | -1 | /var/run/ktree_sock_vv" in found
    assert "  status 255" in found
    assert "    (src.cpp:main): arg[1]: '--search'" in found
    assert found[found.index("tree:"):] == ["tree:", "  /iscsi/initiator/dbg=1", "  /result/search=-1"]


def test_what_was_forgotten_is_in_it(recorded):
    box, lines = recorded
    box.run(["remvol", "--search"])
    box.forget()
    box.run(["remvol", "--search"])
    assert lines().count("  system winshare_reload") == 2


def test_a_run_beside_another_keeps_its_calls(recorded):
    box, lines = recorded
    box.fake("winshare_reload", times=1, delay=0.3)
    first = box.start(["remvol", "--search", "-n", "first"])
    box.wait_until(lambda: box.runs("winshare_reload"))
    box.run(["remvol", "--search", "-n", "second"])
    first.wait()
    found = lines()
    second = found.index("run: remvol --search -n second")
    for part in (found[:second], found[second:]):
        assert [line for line in part if line.startswith("  s")] == [
            "  set /result/search |  | /var/run/ktree_sock_vv", "  system winshare_reload",
            "  set /result/search | -1 | /var/run/ktree_sock_vv", "  status 255"]


def test_the_box_s_own_runs_are_left_out(recorded):
    box, lines = recorded
    box.tree.set("/a", "1")
    assert box.tree.get("/a") == "1"
    box.run(["true"])
    assert lines()[:2] == ["run: true", "  status 0"]


@pytest.mark.parametrize("line, left", [
    ("    (src.cpp:main:12): arg", "    (src.cpp:main): arg"),
    ("    <4>(src.cpp:main:12): arg", "    <4>(src.cpp:main): arg"),
    ("  usleep 8438", "  usleep #"),
    ("  sleep 10", "  sleep 10"),
    ("    1 of 2 needs attention, as of 08:21:45", "    1 of 2 needs attention, as of #:#:#"),
    (f"run outside: {traces.BUILD}/bin/ktreec -S /tmp/ktree.x1y2/sock", "run outside: BUILD/bin/ktreec -S /tmp/ktree.#/sock"),
])
def test_what_is_another_at_each_run_is_replaced(line, left):
    assert traces.settled(line) == left


def compared(tmp_path, before, after):
    for folder, files in (("before", before), ("after", after)):
        for name, text in files.items():
            path = tmp_path / folder / name
            path.parent.mkdir(parents=True, exist_ok=True)
            path.write_text(text)
    done = subprocess.run([SCRIPT, "compare", tmp_path / "before", tmp_path / "after"], stdout=subprocess.PIPE, text=True)
    return done.returncode, done.stdout.splitlines()


def test_equal_recordings(tmp_path):
    same = {"test_a/one.1": "run: remvol\n  status 0\nrun: vv\n", "test_a/two.2": "run: vv\n"}
    status, lines = compared(tmp_path, same, same)
    assert (status, lines[-1]) == (0, "2 tests with 3 runs compared: 0 differ, 0 missing, 0 new")


def test_a_difference_a_missing_and_a_new_test(tmp_path):
    before = {"test_a/one.1": "run: remvol\n  status 0\n", "test_a/two.2": "run: vv\n"}
    after = {"test_a/one.1": "run: remvol\n  status 1\n", "test_a/three.3": "run: vv\n"}
    status, lines = compared(tmp_path, before, after)
    assert status == 1
    assert "-  status 0" in lines and "+  status 1" in lines
    assert lines[-1] == "1 tests with 1 runs compared: 1 differ, 1 missing, 1 new"


def test_a_test_that_is_left_out_is_named(tmp_path):
    before = {"test_a/one.1": "run: vv\n", "test_runs_together/one.1": "run: vv\n"}
    status, lines = compared(tmp_path, before, {"test_a/one.1": "run: vv\n"})
    assert status == 0
    assert any(line.startswith("left out: test_runs_together") for line in lines)


def test_an_empty_recording_is_no_success(tmp_path):
    (tmp_path / "after").mkdir()
    assert compared(tmp_path, {"test_a/one.1": "run: vv\n"}, {})[0] == 1
