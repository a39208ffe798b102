"""The meter of scripts/bench, which says where the time of a run goes, in front of a program of known waits."""

import pathlib
import re
import subprocess
import sys

import pytest

from harness import build_folder

sys.path.insert(0, str(pathlib.Path(__file__).parents[2] / "bench"))
import waits  # noqa: E402

pytestmark = pytest.mark.native  # the meter stands in front of this machine's programs

PROGRAM = """
import ctypes, os, time
c = ctypes.CDLL(None)  # the meter's functions stand in front
c.popen.restype = ctypes.c_void_p
"""


def measured(tmp_path, program):
    """The run of a program in python, and what the meter wrote of it."""
    report = tmp_path / "report"
    source = tmp_path / "program.py"
    source.write_text(PROGRAM + program)
    meter = build_folder() / "bin/bench_meter"
    subprocess.run([meter, report, "a program", "/usr/bin/python3", "-S", source], check=True)
    run, = waits.parse(report.read_text())
    parts = run.start + run.waits + run.programs + run.tree + run.disks + run.kernel + run.ours
    assert run.total == pytest.approx(parts, abs=1e-6)
    return run, report.read_text()


def test_waits_and_programs(tmp_path):
    run, report = measured(tmp_path, """
c.system(b"sleep 0.2")
c.usleep(300000)
c.sleep(1)
""")
    assert run.name == "a program"
    assert run.waits >= 1.3
    assert run.programs >= 0.2
    assert run.tree == run.disks == 0
    lines = [line.split() for line in report.splitlines() if re.match("program|wait", line)]
    assert [line[:2] for line in lines] == [["program", "sleep"], ["wait", "usleep"], ["wait", "sleep"]]
    assert int(lines[1][2]) >= 300_000_000
    assert int(lines[2][2]) >= 1_000_000_000


def test_what_a_program_says_is_waited_for(tmp_path):
    run, _ = measured(tmp_path, """
text = ctypes.create_string_buffer(100)
stream = ctypes.c_void_p(c.popen(b"sleep 0.2; echo said; exec >&-; sleep 0.2", b"r"))
c.fgets(text, 100, stream)
assert text.value == b"said\\n"
c.pclose(stream)
""")
    assert run.programs >= 0.4


def test_a_child_is_a_program_and_tells_nothing_itself(tmp_path):
    run, report = measured(tmp_path, """
child = os.fork()
if child == 0:
    c.usleep(200000)
    os._exit(0)
os.waitpid(child, 0)
""")
    assert run.programs >= 0.2
    assert run.waits == 0
    assert report.count("alive ") == 1


def test_work_is_ours_and_sleep_in_the_kernel_is_not(tmp_path):
    run, _ = measured(tmp_path, """
end = time.process_time() + 0.3
while time.process_time() < end:
    pass
time.sleep(0.5)  # by a call that the tool does not use
""")
    assert run.ours >= 0.3
    assert run.kernel >= 0.4
    assert run.waits == 0


@pytest.mark.unsanitized
def test_a_call_in_a_call_counts_once(tmp_path):
    library = next(build_folder().glob("lib/libsysaux.so"))
    run, report = measured(tmp_path, f"""
ctypes.CDLL("{library}", ctypes.RTLD_GLOBAL)
c.System(b"sleep %s", b"0.3")
""")
    assert "program sleep 0.3\n" in report
    assert run.programs >= 0.3
    assert run.disks < run.programs


def test_programs_are_started_without_the_meter(tmp_path):
    _, report = measured(tmp_path, """
assert c.system(b'test -z "$LD_PRELOAD$BENCH_METER"') == 0
""")
    assert report.count("alive ") == 1


def test_a_run_that_tells_nothing_is_no_run(tmp_path):
    with pytest.raises(ValueError, match="the meter said nothing"):
        measured(tmp_path, "os._exit(0)")
