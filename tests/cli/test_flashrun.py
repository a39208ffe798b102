"""flashrun: the configuration flash is writable for one command, and read-only again whatever happens."""

import os
import signal
import time

import pytest

FOLDER = "/usr/local/config"


class Flash:
    def __init__(self, box):
        self.box = box
        box.path(FOLDER).mkdir(parents=True, exist_ok=True)

    def mount(self, options="ro"):
        self.sh(f"/bin/mount -t tmpfs -o {options} flash {FOLDER}")

    def sh(self, text):
        done = self.box.run(["sh", "-c", text], env={"LD_PRELOAD": None})
        assert done.status == 0, done.stderr
        return done.stdout

    def argv(self, *words):
        return [self.box.build / "bin" / "flashrun", *words]

    def run(self, *words, **options):
        return self.box.run(self.argv(*words), env={"LD_PRELOAD": None}, **options)

    def start(self, *words):
        return self.box.start(self.argv(*words), env={"LD_PRELOAD": None})

    @property
    def options(self):
        lines = [line.split() for line in self.sh("cat /proc/self/mountinfo").splitlines()]
        found = [(line[5].split(","), line[-1].split(",")) for line in lines if line[4] == FOLDER]
        return found[-1] if found else None

    @property
    def read_only(self):
        mount, file_system = self.options
        return "ro" in mount or "ro" in file_system

    def wait_read_only(self):
        self.box.wait_until(lambda: self.read_only, what="the flash being read-only")

    def commands(self, name):
        return [pid for pid, argv in self.box.processes().items() if os.path.basename(argv[0]) == name]

    def kill_all(self, name):
        """Kills every process of that name and waits until they have let go of their files."""
        processes = self.commands(name)
        self.sh("kill -9 " + " ".join(map(str, processes)))
        for pid in processes:
            self.box.wait_until(lambda: self.is_dead(pid), what=f"the end of {name}")

    def is_dead(self, pid):
        try:
            stat = (self.box.root / "proc" / str(pid) / "stat").read_text()
        except OSError:
            return True
        return stat.rsplit(")", 1)[1].split()[0] == "Z"


@pytest.fixture
def flash(bare_box):
    return Flash(bare_box)


COPY_SETTINGS = f"cp -f /etc/NAS_CFG/vv.xml {FOLDER}/"


@pytest.mark.parametrize("mounted", [False, True])
@pytest.mark.parametrize("before", [None, 0o644, 0o600])
def test_the_copy_of_the_settings_is_for_root_alone(flash, mounted, before):
    """Also where one that everybody could read is there already, which cp would leave as open as it was."""
    if mounted:
        flash.mount("rw")
    if before is not None:
        flash.sh(f"echo old >{FOLDER}/vv.xml; chmod {before:o} {FOLDER}/vv.xml")
    if mounted:
        flash.sh(f"/bin/mount -o remount,ro {FOLDER}")
    flash.sh("mkdir -p /etc/NAS_CFG; umask 077; echo new >/etc/NAS_CFG/vv.xml")
    assert flash.run(COPY_SETTINGS).status == 0
    assert flash.sh(f"cat {FOLDER}/vv.xml; stat -c %a {FOLDER}/vv.xml") == "new\n600\n"


def test_a_plain_folder_is_simply_written(flash):
    flash.box.write("/vv.xml", "settings")
    done = flash.run(f"cp -f /vv.xml {FOLDER}/")
    assert (done.status, done.stdout, done.stderr) == (0, "", "")
    assert flash.box.path(f"{FOLDER}/vv.xml").read_text() == "settings"
    assert not flash.box.path("/run/flashrun.door").exists()


@pytest.mark.unsanitized
def test_it_adds_less_than_50_ms_to_its_command(flash):
    def took():
        times = []
        for _ in range(5):
            start = time.monotonic()
            assert flash.run("true").status == 0
            times.append(time.monotonic() - start)
        return min(times)

    assert took() < 0.05
    flash.mount()
    assert took() < 0.05


def test_the_flash_is_writable_for_the_command_alone(flash):
    flash.mount("ro,nosuid,nodev,noatime")
    flash.box.write("/vv.xml", "settings")
    before = flash.options
    done = flash.run(f"cp -f /vv.xml {FOLDER}/")
    assert (done.status, done.stderr) == (0, "")
    assert flash.sh(f"cat {FOLDER}/vv.xml") == "settings"
    assert flash.options == before


def test_a_mount_that_alone_is_read_only_is_opened_alone(flash):
    flash.box.path("/store").mkdir()
    flash.sh("/bin/mount -t tmpfs store /store; mkdir /store/config; /bin/mount --bind /store/config " + FOLDER)
    flash.sh(f"/bin/mount -o remount,bind,ro {FOLDER}")
    assert flash.run(f"touch {FOLDER}/f").status == 0
    mount, file_system = flash.options
    assert "ro" in mount and "rw" in file_system
    flash.sh("touch /store/still-writable")


def test_a_mount_that_is_kept_writable_stays_so(flash):
    flash.mount("rw")
    assert flash.run(f"touch {FOLDER}/f").status == 0
    assert not flash.read_only


def test_the_status_is_the_commands(flash):
    assert flash.run("exit 7").status == 7
    assert flash.run("kill -9 $$").status == -9
    flash.mount()
    assert flash.run("exit 7").status == 7
    assert flash.read_only
    assert flash.run("kill -9 $$").status == 128 + 9
    assert flash.read_only


def test_several_words_are_run_without_a_shell(flash):
    flash.mount()
    assert flash.run("printf", "%s|", "a b", "$HOME").stdout == "a b|$HOME|"
    assert flash.run("no-such-command", "x").status == 127
    assert flash.read_only


def test_nothing_to_run_is_a_usage_error(flash):
    done = flash.run()
    assert done.status == 2 and done.stderr.startswith("usage: flashrun")


def test_a_killed_flashrun_closes_the_flash_when_its_command_is_through(flash):
    flash.mount()
    running = flash.start(f"touch {FOLDER}/begun; sleep 1000; :")
    flash.box.wait_until(lambda: flash.commands("sleep"), what="the command")
    assert not flash.read_only
    os.kill(host_pid(flash, running.pid), signal.SIGKILL)
    assert running.wait().status == -9
    assert not flash.read_only
    flash.kill_all("sleep")
    flash.wait_read_only()


def test_killing_the_whole_group_closes_the_flash(flash):
    flash.mount()
    running = flash.start("sleep 1000")
    flash.box.wait_until(lambda: flash.commands("sleep"), what="the command")
    running.kill(signal.SIGKILL)
    running.wait()
    flash.wait_read_only()
    flash.box.wait_until(lambda: not flash.commands("sleep"), what="the end of the command")


def test_a_killed_guard_is_replaced_by_flashrun(flash):
    flash.mount()
    running = flash.start("sleep 1000")
    flash.box.wait_until(lambda: flash.commands("sleep"), what="the command")
    (guard,) = [pid for pid in flash.commands("flashrun") if pid != running.pid]
    flash.sh(f"kill -9 {guard}")
    assert running.wait().status == 128 + 9
    assert flash.read_only


def test_when_all_of_it_is_killed_the_next_run_closes_the_flash(flash):
    flash.mount()
    running = flash.start("sleep 1000")
    flash.box.wait_until(lambda: flash.commands("sleep"), what="the command")
    flash.kill_all("flashrun")
    running.wait()
    flash.kill_all("sleep")
    assert not flash.read_only
    assert flash.run("true").status == 0
    assert flash.read_only


def test_a_request_to_end_reaches_the_command(flash):
    flash.mount()
    running = flash.start(f"trap 'touch {FOLDER}/told; exit 3' TERM; while :; do sleep 0.01; done")
    flash.box.wait_until(lambda: flash.commands("sleep"), what="the command")
    os.kill(host_pid(flash, running.pid), signal.SIGTERM)
    assert running.wait().status == 3
    assert flash.sh(f"ls {FOLDER}") == "told\n"
    assert flash.read_only


def test_one_run_does_not_close_the_flash_under_another(flash):
    flash.mount()
    slow = flash.start(f"until [ -e /go ]; do sleep 0.01; done; touch {FOLDER}/slow")
    flash.box.wait_until(lambda: not flash.read_only, what="the first run")
    assert flash.run(f"touch {FOLDER}/quick").status == 0
    assert not flash.read_only
    flash.box.write("/go", "")
    assert slow.wait().status == 0
    assert flash.read_only
    assert flash.sh(f"ls {FOLDER}") == "quick\nslow\n"


def test_many_runs_at_once_all_write(flash):
    flash.mount()
    runs = [flash.start(f"touch {FOLDER}/{number}") for number in range(30)]
    assert [run.wait().status for run in runs] == [0] * 30
    assert len(flash.sh(f"ls {FOLDER}").split()) == 30
    assert flash.read_only


def test_a_file_left_open_for_writing_is_reported_and_closed_by_the_next_run(flash):
    flash.mount()
    done = flash.run(f"exec 3>{FOLDER}/f; sleep 1000 >/dev/null 2>&1 &")
    assert done.status == 0
    assert done.stderr == f"flashrun: {FOLDER} stays writable: Device or resource busy\n"
    flash.kill_all("sleep")
    assert flash.run("true").status == 0
    assert flash.read_only


def host_pid(flash, inside):
    """The number outside of the box of its process `inside`."""
    for name in os.listdir("/proc"):
        if name.isdigit():
            try:
                status = open(f"/proc/{name}/status").read()
                same = os.readlink(f"/proc/{name}/ns/pid") == os.readlink(f"/proc/{flash.box.pid}/ns/pid")
            except OSError:
                continue
            numbers = [line.split()[1:] for line in status.splitlines() if line.startswith("NSpid:")][0]
            if same and int(numbers[-1]) == inside:
                return int(name)
    raise LookupError(inside)
