"""What the session listings say, as `--status`, `--search_lun` and `--modify_address` ask for them."""

import re

import pytest
from harness.initiator import (
    BASE,
    SESSIONS,
    DETAILS,
    HEADER,
    T1,
    T2,
    block,
    session,
    store,
)

ROOT = "/iscsi/initiator/id:1"
T10 = T1 + "0"
CHECK_FILE, DEVICE_FILE = "/tmp/remvol_session.tmp", "/tmp/remvol.tmp"


def show(box, plain=None, detailed=None, status=0):
    """Fixed listings."""
    box.fake("iscsiadm", "-m session", exact=True, stdout=plain or "", status=status)
    for words in ("-m session -P3", "-m session -P 3"):
        box.fake("iscsiadm", words, stdout=detailed or "", status=status)


def status(box, luns=(("share1", 1), ("share2", 2)), name=T1, level=None, **values):
    """Runs --status over one stored target."""
    store(box, name, conn_set=1, luns=luns, **values)
    if level is not None:
        box.tree.set("/iscsi/initiator/dbg", level)
    box.hook("sys_get_fs_type", ret=-1)
    return box.remvol("--status")


def devices(box):
    return [box.tree.get(f"{ROOT}/lun/id:{m}/dev") for m in (1, 2)]


# --- is the target logged in ---


@pytest.mark.parametrize(
    "shown, connected",
    [
        (T1, True),
        (T10, False),
        (T1 + "x", False),
        (T1 + "-x", True),  # a simple test, which others rely on
        (T1 + ".x", True),
        (T2, False),
        ("x" + T1, True),
    ],
)
@pytest.mark.parametrize("mark", ["", " (non-flash)"])
def test_a_target_is_connected_when_its_name_is_followed_by_no_letter_or_digit(box, shown, connected, mark):
    show(box, plain=f"tcp: [1] 10.9.0.2:3260,1 {shown}{mark}\n", detailed=HEADER)
    status(box)
    assert box.tree.get(f"{ROOT}/status") == ("Connected" if connected else "Disconnected")


def test_any_line_may_show_the_target(box):
    show(box, plain=session(T10) + session(T2) + session(T1) + session(T10), detailed=HEADER)
    status(box)
    assert box.tree.get(f"{ROOT}/status") == "Connected"


def test_no_session_at_all_is_no_failure(box):
    show(box, status=21)
    done = status(box)
    assert done.status == 0 and "failed" not in done.stdout
    assert box.tree.get(f"{ROOT}/status") == "Disconnected"


def test_the_listing_of_the_check_is_removed_once_it_is_read(box):
    show(box, plain=session(T1), detailed=HEADER)
    status(box)
    assert SESSIONS in box.shell()
    assert not box.path(CHECK_FILE).exists()
    assert box.path(DEVICE_FILE).read_text() == HEADER


def test_a_listing_that_disappears_means_not_connected(box):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1), effect=f"rm {CHECK_FILE}")
    box.fake("iscsiadm", "-m session -P3", stdout=HEADER)
    status(box)
    assert box.tree.get(f"{ROOT}/status") == "Disconnected"


def test_temporary_files_are_named_after_the_program(box):
    show(box, plain=session(T1), detailed=HEADER)
    store(box, T1, conn_set=1)
    box.run(["ln", "-s", str(box.build / "bin/remvol"), "/tmp/other-name"])
    assert box.run(["/tmp/other-name", "--status"]).status == 0
    assert SESSIONS.replace("remvol_", "other-name_") in box.shell()
    assert DETAILS.replace("remvol", "other-name") in box.shell()


@pytest.mark.parametrize("name", [CHECK_FILE, DEVICE_FILE])
def test_a_planted_link_is_not_written_through(box, name):
    box.write("/root/precious", "kept")
    box.path(name).symlink_to("/root/precious")
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    status(box)
    assert box.path("/root/precious").read_text() == "kept"
    assert box.tree.get(f"{ROOT}/status") == "Connected"
    assert devices(box)[0] == "sdb"


def test_a_planted_file_of_another_user_does_not_stop_the_tool(box):
    box.write(CHECK_FILE, "planted")
    box.run(["chown", "nobody", CHECK_FILE])
    show(box, plain=session(T1), detailed=HEADER)
    status(box)
    assert box.tree.get(f"{ROOT}/status") == "Connected"


@pytest.mark.parametrize("code", [1, 4, 20, 255])
def test_a_failing_listing_is_logged_with_its_status(box, code):
    show(box, status=code)
    box.tree.set({f"{ROOT}/conn_state": "1", f"{ROOT}/status": "Connected"})
    done = status(box, luns=[("share1", 1, {"dev": "sdb"})], level="2")
    assert done.status == 0
    assert re.search(rf"\(src\.cpp:ktree_update_dev:\d+\): system\(\) of cmd '{DETAILS}' failed", done.stdout)
    text = f"): !!!ret={code << 8}, WIFEXITED=1, WEXITSTATUS={code}\n"
    assert re.search(r"\(src\.cpp:ktree_update_dev:\d+" + re.escape(text), done.stdout)
    assert "iscsiadm -m session failed. Skip this target." in done.stdout
    assert devices(box)[0] == "sdb"


def test_a_killed_listing_did_not_exit(box):
    box.hook("system", DETAILS, ret=9)
    done = status(box, level="2")
    assert "!!!ret=9, WIFEXITED=0, WEXITSTATUS=0" in done.stdout


def test_a_missing_iscsiadm_leaves_everything_as_it_was(box):
    box.path("/fake/bin/iscsiadm").unlink()
    box.run(["rm", "-f", "/usr/bin/iscsiadm", "/usr/sbin/iscsiadm"])
    box.tree.set({f"{ROOT}/conn_state": "1", f"{ROOT}/status": "Connected"})
    done = status(box, luns=[("share1", 1, {"dev": "sdb"})])
    assert f"system() of cmd '{DETAILS}' failed" in done.stdout
    assert devices(box)[0] == "sdb"
    assert box.tree.get(f"{ROOT}/status") == "Connected"


# --- device names into the tree ---


def test_every_stored_lun_gets_its_device(box):
    luns = {0: None, 1: "sdb", 3: "sdx", 10: "sdl", 2: "sdc"}
    show(box, plain=session(T1), detailed=HEADER + block(T10, {1: "sdz"}) + block(T1, luns) + block(T2, {2: "sdy"}))
    status(box)
    assert devices(box) == ["sdb", "sdc"]


def test_names_are_compared_whole(box):
    show(box, plain=session(T1), detailed=HEADER + block(T10, {1: "sdz"}) + block(T1 + "-x", {1: "sdy"}))
    status(box)
    assert devices(box) == ["", ""]


def test_the_older_systems_listing_without_mark(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}, mark=""))
    status(box)
    assert devices(box) == ["sdb", ""]


def test_a_controller_without_disk_hides_no_lun_and_borrows_no_disk(box):
    detailed = HEADER + block(T1, {0: None, 1: "sdb", 2: None}) + block(T2, {1: "sdy", 2: "sdz"})
    show(box, plain=session(T1), detailed=detailed)
    status(box)
    assert devices(box) == ["sdb", ""]


def test_old_device_names_are_cleared_first(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {2: "sdc"}))
    status(box, luns=[("share1", 1, {"dev": "sdq"}), ("share2", 2, {"dev": "sdr"})])
    assert devices(box) == ["", "sdc"]
    writes = [call for call in box.trace("set") if call.startswith(f"set {ROOT}/lun/id") and "/dev=" in call]
    assert writes == [f"set {ROOT}/lun/id:1/dev=", f"set {ROOT}/lun/id:2/dev=", f"set {ROOT}/lun/id:2/dev=sdc"]


def test_clearing_stops_at_the_first_empty_slot(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {}))
    box.tree.set({f"{ROOT}/lun/id:3/lun": "7", f"{ROOT}/lun/id:3/share": "c", f"{ROOT}/lun/id:3/dev": "sdq"})
    status(box, luns=[("share1", 1, {"dev": "sdb"})])
    assert devices(box)[0] == ""
    assert box.tree.get(f"{ROOT}/lun/id:3/dev") == "sdq"


def test_without_any_session_no_device_name_is_cleared(box):
    show(box, status=21)
    status(box, luns=[("share1", 1, {"dev": "sdb"})])
    assert devices(box)[0] == "sdb"


def test_with_another_targets_session_alone_the_names_are_cleared(box):
    show(box, plain=session(T2), detailed=HEADER + block(T2, {1: "sdc"}))
    status(box, luns=[("share1", 1, {"dev": "sdb"})])
    assert devices(box)[0] == ""


def test_a_session_that_is_not_logged_in_shows_no_disk(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}, state="FAILED"))
    status(box)
    assert devices(box) == ["", ""]


def test_a_disk_that_does_not_run_is_not_stored(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: ("sdb", "blocked"), 2: "sdc"}))
    status(box)
    assert devices(box) == ["", "sdc"]


def test_a_write_that_fails_does_not_stop_the_others(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb", 2: "sdc"}))
    box.hook("ktreec_set", f"{ROOT}/lun/id:1/dev", value="sdb", ret=-1)
    done = status(box)
    assert done.status == 255
    assert re.search(r"\(src\.cpp:ktree_update_dev:\d+\): ktreec_set\(\) failed", done.stdout)
    assert devices(box) == ["", "sdc"]


def test_a_clearing_that_fails_ends_the_update(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb", 2: "sdc"}))
    box.hook("ktreec_set", f"{ROOT}/lun/id:1/dev", value="", ret=-1)
    done = status(box)
    assert re.search(r"\(src\.cpp:ktree_clean_target_dev:\d+\): ktreec_set\(\) failed", done.stdout)
    assert f"): ktree_clean_target_dev for {T1} failed\n" in done.stdout
    assert devices(box)[1] == ""


def test_the_reading_is_logged(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    done = status(box, level="2")
    texts = re.findall(r"\(src\.cpp:ktree_update_dev:\d+\): ((?:.|\n)*?)(?=\n\(src)", done.stdout)
    assert texts == ["start", "get lun = 1", "ptr: 'sdb\t\tState: running\n', len: 4", "end"]


def test_a_listing_cut_anywhere_names_no_wrong_disk(box):
    detailed = HEADER + block(T2, {1: "sdy", 2: "sdz"}) + block(T1, {0: None, 1: "sdba", 2: "sdbb"})
    show(box, plain=session(T1))
    begin = detailed.index(f"Target: {T1}")
    cuts = [*range(begin, len(detailed), 37), detailed.index("sdba") + 2, detailed.index("sdbb") + 2]
    for cut in cuts:
        box.fake("iscsiadm", "-m session -P3", stdout=detailed[:cut], first=True)
        assert status(box).status == 0
        assert devices(box) in (["", ""], ["sdba", ""], ["sdba", "sdbb"])


def test_a_listing_of_10000_lines(box):
    box.write("/fake/long", "".join(block(f"{BASE}n{n}", {0: None, 1: f"sd{n}"}) for n in range(1000)))
    box.write("/fake/end", block(T1, {1: "sdb", 2: "sdc"}))
    assert len(box.path("/fake/long").read_text().splitlines()) >= 10000
    box.fake("iscsiadm", "-m session -P3", effect="cat /fake/long /fake/end")
    sessions = "".join(session(f"{BASE}n{n}") for n in range(10000)) + session(T1)
    box.write("/fake/sessions", sessions)
    box.fake("iscsiadm", "-m session", exact=True, effect="cat /fake/sessions")
    assert status(box).status == 0
    assert devices(box) == ["sdb", "sdc"]
    assert box.tree.get(f"{ROOT}/status") == "Connected"


def test_a_name_of_255_characters(box):
    name = "iqn." + "n" * 251
    show(box, plain=session(name), detailed=HEADER + block(name + "n", {1: "sdz"}) + block(name, {1: "sdb"}))
    assert status(box, name=name).status == 0
    assert devices(box) == ["sdb", ""]
    assert box.tree.get(f"{ROOT}/status") == "Connected"


# --- waiting for a LUN, and the list of LUNs, as --search_lun does it ---

RULE = "-----------------------------------------------------------------------------------------"
TITLE = "---------------------------------- Avaliable LUN List -----------------------------------"
SIZE = 64 << 20


def search_lun(box, level="2", name=T1):
    box.tree.set("/iscsi/initiator/dbg", level)
    box.hook("ktreec_set", re.compile("^/temp/vv_search_lun/"))
    return box.remvol("--search_lun", "-n", name, "-c", "0", "-i", "10.9.0.2", "-p", "3260")


def list_text(*lines):
    return "\n".join([TITLE, f"| Target : {T1}", "|" + RULE[1:], *lines, RULE]) + "\n"


def lun_line(lun, size, fs_type):
    return f"|-- LUN: {lun} , Size : {size} bytes, Type of File System (first partition): {fs_type} "


def published(box):
    return [call.removeprefix("set /temp/vv_search_lun/") for call in box.trace("set") if "vv_search_lun" in call]


def disk_sizes(box, **sizes):
    for device, size in sizes.items():
        box.hook("sys_get_disk_space", f"/dev/{device}", ret=size)


def test_the_rules_of_the_list_are_as_long_as_its_title():
    assert len(TITLE) == len(RULE) == 89


def test_the_luns_of_a_session(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {0: None, 1: "sdb", 10: "sdc", 2: ("sdd", "offline")}))
    disk_sizes(box, sdb=SIZE, sdc=2 * SIZE)
    box.write("/dev/sdb1", "")
    box.hook("sys_get_fs_type", "/dev/sdb1", out="ext4")
    done = search_lun(box)
    assert done.status == 0
    lines = [lun_line(1, SIZE, "ext4"), lun_line(10, 2 * SIZE, "unknown")]
    assert list_text(*lines) in done.stdout
    assert published(box) == [
        f"target_name={T1}",
        "lun/id:1/lun=1", f"lun/id:1/size={SIZE}", "lun/id:1/avaliable=1", "lun/id:1/fstype=ext4",
        "lun/id:2/lun=10", f"lun/id:2/size={2 * SIZE}", "lun/id:2/avaliable=1", "lun/id:2/fstype=unknown",
        "lun/count=2",
        "err_code=0",
    ]


def test_the_device_node_is_there_before_the_size_is_asked(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    box.write("/sys/block/sdb/dev", "8:16\n")
    disk_sizes(box, sdb=SIZE)
    search_lun(box)
    assert [call for call in box.trace("mknod") if "/dev/sdb " in call]


def test_a_file_system_that_is_not_recognised_is_unknown(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    disk_sizes(box, sdb=SIZE)
    box.write("/dev/sdb1", "")
    box.hook("sys_get_fs_type", "/dev/sdb1", out="rest", ret=-1)
    done = search_lun(box)
    assert lun_line(1, SIZE, "unknown") in done.stdout


@pytest.mark.parametrize("size, listed", [(1048577, True), (1048576, False), (0, False), (-1, False)])
def test_a_lun_of_a_mebibyte_or_less_is_left_out(box, size, listed):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb", 2: "sdc"}))
    disk_sizes(box, sdb=size, sdc=SIZE)
    done = search_lun(box)
    assert (lun_line(1, size, "unknown") in done.stdout) == listed
    assert lun_line(2, SIZE, "unknown") in done.stdout


def test_only_small_luns_give_neither_list_nor_result(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    disk_sizes(box, sdb=1 << 20)
    done = search_lun(box)
    assert done.status == 0
    assert "Avaliable LUN List" not in done.stdout
    assert published(box) == ["err_code=0"]


@pytest.mark.parametrize("size", [5 << 40, 20 << 40])
def test_a_lun_of_many_tebibytes(box, size):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    disk_sizes(box, sdb=size)
    assert lun_line(1, size, "unknown") in search_lun(box).stdout


def test_the_wait_ends_with_the_first_usable_lun(box):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1))
    box.fake("iscsiadm", "-m session -P 3", stdout=HEADER + block(T1, {0: None, 1: ("sdb", "blocked")}), times=2)
    box.fake("iscsiadm", "-m session -P 3", stdout=HEADER + block(T1, {0: None, 1: "sdb"}))
    disk_sizes(box, sdb=SIZE)
    done = search_lun(box, level="1")
    assert re.findall(r"_wait_sess_lun_ready:\d+\): wait lun ready iter = (\d+)", done.stdout) == ["29", "28", "27"]
    assert box.trace("usleep") == ["usleep 100000"] * 3
    assert lun_line(1, SIZE, "unknown") in done.stdout


def test_the_wait_ends_after_thirty_polls(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {0: None}))
    done = search_lun(box, level="1")
    assert done.status == 0
    assert box.trace("usleep") == ["usleep 100000"] * 30
    assert f"): Can not find any available LUN on target {T1}\n" in done.stdout
    assert list_text("| None of avaliable LUN is found ") in done.stdout
    assert published(box) == [f"target_name={T1}", "lun/count=0", "err_code=0"]


# Across the polls a LOGGED_IN stays counted.
def test_a_state_seen_by_an_earlier_poll_counts(box):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1))
    box.fake("iscsiadm", "-m session -P 3", stdout=HEADER + block(T1, {}), times=1)
    box.fake("iscsiadm", "-m session -P 3", stdout=HEADER + block(T1, {1: "sdb"}, state="FAILED"))
    search_lun(box)
    assert len(box.trace("usleep")) == 2


def test_no_session_counts_as_ready_and_lists_nothing(box):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1))
    box.fake("iscsiadm", "-m session -P 3", status=21)
    done = search_lun(box)
    assert done.status == 0
    assert len(box.trace("usleep")) == 1
    assert published(box) == ["err_code=0"]


@pytest.mark.parametrize("good_listings", [0, 1])
def test_a_failing_listing_fails_the_search(box, good_listings):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1))
    box.fake("iscsiadm", "-m session -P 3", stdout=HEADER + block(T1, {1: "sdb"}), times=good_listings)
    box.fake("iscsiadm", "-m session -P 3", status=4)
    done = search_lun(box)
    assert done.status == 255
    assert "): get session lun list failed\n" in done.stdout
    assert published(box) == []


def test_the_files_of_the_search_are_drawn_and_removed(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    disk_sizes(box, sdb=SIZE)
    done = search_lun(box)
    for user in ("wait", "get"):
        command = rf"iscsiadm -m session -P 3 >/tmp/remvol_session_{user}_lun_\d{{1,2}}\.tmp 2>&1"
        assert any(re.fullmatch(command, text) for text in box.shell())
        assert re.search(rf"\): run cmd: {command}$", done.stdout, re.M)
    assert not [entry.name for entry in box.path("/tmp").iterdir() if "_lun_" in entry.name]


def test_a_drawn_file_is_none_that_exists(box):
    for number in range(100):
        if number != 42:
            box.write(f"/tmp/remvol_session_wait_lun_{number}.tmp", "left over")
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    disk_sizes(box, sdb=SIZE)
    search_lun(box)
    assert "iscsiadm -m session -P 3 >/tmp/remvol_session_wait_lun_42.tmp 2>&1" in box.shell()


def test_left_over_files_of_all_numbers_do_not_hang_the_tool(box):
    for number in range(100):
        box.write(f"/tmp/remvol_session_wait_lun_{number}.tmp", "left over")
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}))
    disk_sizes(box, sdb=SIZE)
    assert search_lun(box, level="0").status == 0


def test_failing_searches_leave_no_drawn_file(box):
    for code in (21, 4):
        box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1), times=1)
        box.fake("iscsiadm", "-m session -P 3", status=code, first=True)
        search_lun(box)
    assert not [entry.name for entry in box.path("/tmp").iterdir() if "_lun_" in entry.name]


def test_an_unreadable_listing_is_an_empty_list(box):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1))
    listing = HEADER + block(T1, {1: "sdb"})
    box.fake("iscsiadm", "-m session -P 3", stdout=listing, times=1)
    box.fake("iscsiadm", "-m session -P 3", stdout=listing, effect="rm /tmp/remvol_session_get_lun_*")
    done = search_lun(box)
    assert done.status == 0
    assert published(box) == ["err_code=0"]


def test_the_steps_of_the_list_are_logged(box):
    show(box, plain=session(T1), detailed=HEADER + block(T1, {1: "sdb"}, host=7))
    disk_sizes(box, sdb=SIZE)
    box.write("/dev/sdb1", "")
    box.hook("sys_get_fs_type", "/dev/sdb1", out="ext4")
    done = search_lun(box)
    texts = re.findall(r"\(src\.cpp:_get_sess_lun_list:\d+\): ((?:.|\n)*?)(?=\n\(src)", done.stdout)
    assert texts[1:] == [
        "get host num = 7",
        "get lun = 1",
        "ptr: 'sdb\t\tState: running\n', len: 4",
        "get dev_node = sdb",
        f"get size = {SIZE}",
        "try to get_fs_type from /dev/sdb1",
        "get fstype = ext4",
    ]
