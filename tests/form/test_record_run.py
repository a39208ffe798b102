"""What scripts/record-run writes of a long run."""

import pathlib
import shutil
import subprocess

TOP = pathlib.Path(__file__).resolve().parents[2]


def recorded(folder, command):
    """The line that a run of the command adds."""
    for name in ("scripts", "docs"):
        (folder / name).mkdir()
    script = pathlib.Path(shutil.copy(TOP / "scripts/record-run", folder / "scripts"))
    (folder / "docs/trust-runs.md").write_text("| day |\n")
    git = ["git", "-c", "user.name=a", "-c", "user.email=a@example.org", "-C", folder]
    for words in (["init", "-q"], ["add", "."], ["commit", "-qm", "all"]):
        subprocess.run([*git, *words], check=True)
    done = subprocess.run([script, *command], stdout=subprocess.PIPE, text=True)
    head, *lines = (folder / "docs/trust-runs.md").read_text().splitlines()
    assert head == "| day |"
    return done.returncode, [line.split(" | ")[2:] for line in lines]


def test_the_line_has_the_command_without_this_machine_s_folders(tmp_path):
    command = ["printf", "many: 2 passed, 0 failed %.0s%.0s%.0s%.0s%.0s(%s)\\n",
               "--stories", "/srv/stories/many", "--results", "/srv/faults", "--only", "a|b"]
    assert recorded(tmp_path, command) == (0, [[
        "`printf many: 2 passed, 0 failed %.0s%.0s%.0s%.0s%.0s(%s)\\n --stories FOLDER --results FILE --only a\\|b`",
        "2 passed, 0 failed (a|b) |"]])


def test_a_run_that_does_not_say_how_many_passed_adds_none(tmp_path):
    assert recorded(tmp_path, ["echo", "many"]) == (2, [])
