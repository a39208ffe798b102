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
    assert not flash.box.path("/run/remvol/flash.door").exists()


@pytest.mark.unsanitized
@pytest.mark.native
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


@pytest.mark.parametrize("mounted", [False, True])
def test_a_caller_that_ignores_the_end_of_its_children_gets_the_status(flash, mounted):
    if mounted:
        flash.mount()
    done = flash.box.run(["env", "--ignore-signal=CHLD", *flash.argv(f"touch {FOLDER}/f; exit 7")], env={"LD_PRELOAD": None})
    assert done.status == 7
    assert not mounted or flash.read_only


@pytest.mark.unsanitized
def test_a_command_that_cannot_be_waited_for_has_failed(flash):
    flash.mount()
    assert traced(flash, ["-e", "inject=wait4:error=ECHILD"], "true").status == 126


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


# --- the copy of the settings is whole at every moment ---

OLD = "<config>" + "<a>old</a>" * 900 + "</config>\n"
NEW = "<config>" + "<a>newer</a>" * 900 + "</config>\n"
SAVED, COPY = "/etc/NAS_CFG/vv.xml", f"{FOLDER}/vv.xml"


@pytest.fixture
def copied(flash):
    """A flash with an old copy beside new settings."""
    flash.box.write(SAVED, NEW, mode=0o600)
    flash.box.write(COPY, OLD, mode=0o600)
    return flash


def names(flash):
    return sorted(os.listdir(flash.box.path(FOLDER)))


def content(flash):
    return flash.box.path(COPY).read_text()


def traced(flash, option, *words):
    log = "/fake/trace"
    return flash.box.run(["strace", "-f", "-y", "-o", log, *option, *flash.argv(*words)],
                         env={"LD_PRELOAD": None, "ASAN_OPTIONS": "detect_leaks=0"})


STEPS = ["openat", "fchmod", "pread64", "write", "fsync", "rename,renameat,renameat2", "close", "unlink,unlinkat"]


@pytest.mark.unsanitized
@pytest.mark.parametrize("step", STEPS)
def test_a_copy_that_dies_at_any_moment_leaves_the_old_one_or_the_new_one(copied, step):
    deaths = 0
    while True:
        copied.box.write(COPY, OLD)
        done = traced(copied, ["-e", f"inject={step}:signal=SIGKILL:when={deaths + 1}"], COPY_SETTINGS)
        if done.status == 0:
            break
        deaths += 1
        assert content(copied) in (OLD, NEW)
    assert deaths > 0
    assert content(copied) == NEW
    assert copied.run(COPY_SETTINGS).status == 0
    assert names(copied) == ["vv.xml"]


@pytest.mark.unsanitized
@pytest.mark.parametrize("fault", ["fchmod:error=EIO", "write:error=ENOSPC", "write:error=EIO", "fsync:error=EIO",
                                   "rename,renameat,renameat2:error=EROFS", "pread64:error=EIO"])
def test_a_copy_that_fails_leaves_the_old_one_and_says_so(copied, fault):
    of_the_settings = ["-P", SAVED] if "pread64" in fault else []  # the loader of programs reads in this way as well
    done = traced(copied, [*of_the_settings, "-e", f"inject={fault}:when=1"], COPY_SETTINGS)
    assert done.status == 1
    assert done.stderr.startswith(f"flashrun: {SAVED} is not copied to {FOLDER}: ")
    assert content(copied) == OLD
    assert names(copied) == ["vv.xml"]


def test_a_full_flash_keeps_the_old_copy(flash):
    flash.mount("rw,size=64k")
    flash.box.write(SAVED, NEW)
    flash.box.write("/old", OLD)
    flash.sh(f"cp /old {COPY}; cat /dev/zero >{FOLDER}/fill 2>/dev/null; /bin/mount -o remount,ro {FOLDER}")
    done = flash.run(COPY_SETTINGS)
    assert (done.status, done.stderr) == (
        1, f"flashrun: {SAVED} is not copied to {FOLDER}: No space left on device\n")
    assert flash.sh(f"cat {COPY}") == OLD
    assert flash.sh(f"ls -A {FOLDER}").split() == ["fill", "vv.xml"]
    assert flash.read_only


@pytest.mark.unsanitized
def test_the_copy_is_on_the_disk_before_it_gets_the_name_and_the_folder_after_it(copied):
    assert traced(copied, ["-e", "trace=fsync,rename,renameat,renameat2"], COPY_SETTINGS).status == 0
    lines = [line for line in copied.box.path("/fake/trace").read_text().splitlines() if FOLDER in line]
    assert [line.split("(")[0].split()[-1] for line in lines] == ["fsync", "renameat", "fsync"]
    assert ".new>" in lines[0] and f"{FOLDER}>" in lines[2]


@pytest.mark.parametrize("line", [f"cp -f {SAVED} {FOLDER}/", f"cp {SAVED} {FOLDER}", f" cp  -f {SAVED}\t{COPY} ",
                                  ("cp", "-f", SAVED, f"{FOLDER}/"), ("cp", SAVED, COPY)])
@pytest.mark.parametrize("mounted", [False, True])
def test_every_plain_copy_is_one_step(copied, line, mounted):
    if mounted:
        copied.mount("rw")
        copied.sh(f"echo '{OLD.strip()}' >{COPY}; /bin/mount -o remount,ro {FOLDER}")
    before = copied.sh(f"stat -c %i {COPY}")
    done = copied.run(*(line if isinstance(line, tuple) else (line,)))
    assert (done.status, done.stdout, done.stderr) == (0, "", "")
    assert copied.sh(f"cat {COPY}") == NEW
    assert copied.sh(f"stat -c %i {COPY}") != before
    assert copied.sh(f"stat -c %a {COPY}") == "600\n"


@pytest.mark.parametrize("line", [f"cp -f {SAVED} {FOLDER}/; exit 3", f"X=1 cp {SAVED} {FOLDER}/ && exit 3",
                                  f"cp $PWD{SAVED} {FOLDER}/; exit 3"])
def test_other_lines_are_the_shells(copied, line):
    assert copied.run(line).status == 3
    assert content(copied) == NEW


def test_settings_that_are_missing_are_said(flash):
    done = flash.run(COPY_SETTINGS)
    assert (done.status, done.stderr) == (1, f"flashrun: {SAVED}: No such file or directory\n")
    assert names(flash) == []


def test_a_link_in_the_place_of_the_copy_is_replaced(copied):
    copied.box.write("/precious", "precious")
    copied.sh(f"ln -sf /precious {COPY}")
    assert copied.run(COPY_SETTINGS).status == 0
    assert content(copied) == NEW and not copied.box.path(COPY).is_symlink()
    assert copied.box.path("/precious").read_text() == "precious"


@pytest.mark.parametrize("mounted", [False, True])
@pytest.mark.parametrize("line", [f"head -c 100 {SAVED} >{COPY}", f"{{ cat {SAVED}; head -c 9 /dev/zero; }} >{COPY}", f": >{COPY}; exit 5", f": >{COPY}; kill -9 $$"])
def test_settings_that_another_command_leaves_torn_are_put_back(copied, line, mounted):
    if mounted:
        copied.mount("rw")
        copied.sh(f"echo '{OLD.strip()}' >{COPY}; /bin/mount -o remount,ro {FOLDER}")
    done = copied.run(line)
    assert done.status == (5 if "exit" in line else 128 + 9 if "kill" in line else 1)
    assert done.stderr == f"flashrun: {COPY} was torn, the former one is back\n"
    assert copied.sh(f"cat {COPY}; ls -A {FOLDER}") == OLD + "vv.xml\n"


@pytest.mark.parametrize("line, left", [(f"cat {SAVED} >{COPY}", NEW), (f"rm {COPY}", None), ("exit 0", OLD)])
def test_what_another_command_does_on_purpose_stays(copied, line, left):
    done = copied.run(line)
    assert (done.status, done.stderr) == (0, "")
    assert names(copied) == ([] if left is None else ["vv.xml"])
    assert left is None or content(copied) == left


def test_settings_that_a_killed_command_left_torn_are_put_back_by_the_next_run(copied):
    running = copied.start(f": >{COPY}; sleep 1000")
    copied.box.wait_until(lambda: copied.commands("sleep"), what="the command")
    copied.kill_all("flashrun")
    copied.kill_all("sleep")
    running.wait()
    assert content(copied) == ""
    assert copied.run("true").status == 0
    assert content(copied) == OLD and names(copied) == ["vv.xml"]


def test_what_a_running_command_keeps_is_left_to_it(copied):
    running = copied.start(f": >{COPY}; until [ -e /go ]; do sleep 0.01; done")
    copied.box.wait_until(lambda: content(copied) == "", what="the command")
    assert copied.run("true").status == 0
    assert len(names(copied)) == 2 and content(copied) == ""
    copied.box.write("/go", "")
    assert running.wait().status == 1
    assert content(copied) == OLD and names(copied) == ["vv.xml"]


def test_many_copies_at_once_are_all_whole(copied):
    runs = [copied.start(COPY_SETTINGS) for _ in range(20)]
    while any(run.result is None for run in runs):
        assert content(copied) in (OLD, NEW)
        copied.box.pump(0.01)
    assert [run.wait().status for run in runs] == [0] * 20
    assert content(copied) == NEW and names(copied) == ["vv.xml"]


@pytest.mark.unsanitized
def test_a_copy_that_stays_open_to_others_is_told(copied):
    copied.box.path(COPY).chmod(0o644)
    done = traced(copied, ["-e", "inject=fchmod:error=EIO:when=1"], "true")
    assert (done.status, done.stderr) == (0, f"flashrun: {COPY} stays readable for others: Input/output error\n")


@pytest.mark.unsanitized
@pytest.mark.native
def test_a_flash_that_nobody_can_watch_is_closed_at_once(flash):
    flash.mount()
    done = traced(flash, ["-e", "inject=clone,clone3,fork,vfork:error=EAGAIN:when=1"], f"touch {FOLDER}/f")
    assert (done.status, done.stderr) == (126, "flashrun: fork: Resource temporarily unavailable\n")
    assert flash.read_only
    assert flash.sh(f"ls {FOLDER}") == ""


# --- locks ---

LOCKS = "/run/remvol"


def test_the_locks_are_roots_alone(flash):
    flash.mount()
    assert flash.run("true").status == 0
    assert flash.sh(f"stat -c '%a %u' {LOCKS}/flash.door {LOCKS}/flash.users") == "600 0\n600 0\n"


@pytest.mark.parametrize("plant", [f"mkdir {LOCKS}; touch {LOCKS}/x; chown 1234 {LOCKS}", f"ln -s /tmp {LOCKS}",
                                   f"touch {LOCKS}", f"mkdir -m 777 {LOCKS}"])
def test_a_lock_folder_that_others_made_is_not_used(flash, plant):
    flash.sh(plant)
    flash.mount()
    done = flash.run(f"touch {FOLDER}/f")
    assert (done.status, done.stderr) == (0, "")
    assert flash.sh(f"stat -c '%F %a %u' {LOCKS}") in ("directory 700 0\n", "directory 755 0\n")
    assert flash.read_only


@pytest.mark.parametrize("plant", ["touch {0}; chmod 644 {0}", "touch {0}; chown 1234 {0}", "ln -s /precious {0}",
                                   "mkfifo {0}"])
def test_a_lock_that_others_can_hold_is_not_waited_for(flash, plant):
    flash.mount()
    flash.sh(f"mkdir -m 755 {LOCKS}; touch /precious")
    for name in ("flash.door", "flash.users"):
        flash.sh(plant.format(f"{LOCKS}/{name}"))
    holder = flash.start("true") if "fifo" in plant else flash.box.start(
        ["flock", f"{LOCKS}/flash.door", "sleep", "1000"], env={"LD_PRELOAD": None})
    if "fifo" not in plant:
        flash.box.wait_until(lambda: flash.commands("sleep"), what="the holder")
    assert flash.run("true", timeout=10).status == 0
    assert flash.sh(f"stat -c '%F %a %u' {LOCKS}/flash.door") == "regular empty file 600 0\n"
    flash.sh("pkill -x sleep || :")
    holder.wait()


def test_without_a_lock_the_flash_stays_as_it_is(flash):
    flash.mount()
    flash.sh("/bin/mount -o remount,ro /run")
    done = flash.run("true")
    assert done.status == 0
    assert done.stderr.splitlines()[0] == f"flashrun: {FOLDER} cannot be made writable: Permission denied"
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
