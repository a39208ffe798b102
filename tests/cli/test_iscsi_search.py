"""`--search` and `--search_lun`: what a portal and a target offer."""

import re

import pytest
from harness import messages
from harness.initiator import (
    BASE,
    SESSIONS,
    T1,
    Initiator,
    login_command,
    logout_command,
    record_commands,
    store,
)
from harness.tree import Tree

DISCOVER = "iscsiadm -m discovery -t sendtargets -p 10.9.0.2:3260 -I default > /tmp/remvol.tmp"
SEARCH = ("--search", "-i", "10.9.0.2", "-p", "3260")
DEFAULT_SOCKET = "/var/run/ktree_sock"
SIZE = 64 << 20


def lines(*names, portal="10.9.0.2:3260"):
    return "".join(f"{portal},1 {name}\n" for name in names)


def daemon_road(kind, *commands):
    """The shell texts of a search with an output file."""
    socket = f"/var/run/ktree_sock_vv_{kind}"
    return [
        f"system ktree -n config -s {socket} 1>/dev/null 2>/dev/null &",
        "sleep 1",
        *commands,
        f"system kill -SIGTERM `cat {socket}_config.pid`",
    ]


@pytest.fixture
def results(box):
    """The client library's default tree, where a search without output file publishes."""
    return Tree(box, DEFAULT_SOCKET).start()


def private_tree(box, kind):
    """The second that the tool waits is time enough for the daemon to start."""
    box.hook("sleep", "1", effect=f"until [ -S /var/run/ktree_sock_vv_{kind} ]; do sleep 0.01; done")


def search(box, *args, status=0):
    done = box.remvol(*SEARCH, *args)
    assert done.status == status, done.stdout
    return done


def found(tree):
    return tree.dump("/temp/vv_search")


# --- targets of a portal ---


def test_the_names_are_published_in_ascending_order(box, results):
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:b", "iqn.x:a", "iqn.x:B"))
    search(box)
    assert found(results) == {
        "/temp/vv_search/id:1/name": "iqn.x:B",
        "/temp/vv_search/id:2/name": "iqn.x:a",
        "/temp/vv_search/id:3/name": "iqn.x:b",
        "/temp/vv_search/search_done": "1",
    }
    assert box.trace() == [f"system {DISCOVER}"]
    assert box.path("/tmp/remvol.tmp").read_text() == lines("iqn.x:b", "iqn.x:a", "iqn.x:B")
    assert box.tree.dump("/temp") == {}


def test_lines_of_other_addresses_are_left_out(box, results):
    other = lines("iqn.x:other", portal="10.9.1.2:3260") + lines("iqn.x:v6", portal="[fd00:9::2]:3260")
    box.fake("iscsiadm", "-m discovery", stdout=other)
    search(box)
    assert found(results) == {"/temp/vv_search/search_done": "1"}


def test_an_address_with_the_same_begin_counts_and_names_stay_double(box, results):
    text = lines("iqn.x:a") + lines("iqn.x:a", portal="10.9.0.2:3261") + lines("iqn.x:a", portal="10.9.0.20:3260")
    box.fake("iscsiadm", "-m discovery", stdout=text)
    search(box)
    assert list(found(results).values()) == ["iqn.x:a"] * 3 + ["1"]


def test_lines_without_a_name_are_counted_alone(box, results):
    results.set("/temp/vv_search/search_done", "0")
    box.tree.set("/iscsi/initiator/dbg", "3")
    box.fake("iscsiadm", "-m discovery", stdout="10.9.0.2:3260,1\n" + lines("iqn.x:a") + "10.9.0.2:3260,1\n")
    done = search(box)
    assert messages(done, "task_search") == [
        "start",
        "ip: 10.9.0.2, port: 3260",
        "line 1: ",
        "line 2: iqn.x:a",
        "line 3: iqn.x:a",
        "vector size: 1",
        "vector(0): iqn.x:a",
        "end, ret = 0",
    ]


def test_what_a_search_says_without_asking(box, results):
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a"))
    done = search(box)
    assert messages(done) == [
        "ip: 10.9.0.2, port: 3260",
        "vector size: 1",
        "ktreec_del() failed, path: '/temp/vv_search'",
    ]


def test_the_names_of_an_earlier_search_are_gone(box, results):
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a", "iqn.x:b", "iqn.x:c"), times=1)
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:d"))
    search(box)
    done = search(box)
    assert found(results) == {"/temp/vv_search/id:1/name": "iqn.x:d", "/temp/vv_search/search_done": "1"}
    assert "ktreec_del" not in done.stdout


def test_a_portal_that_cannot_be_reached_fails_with_an_empty_list(box, results):
    box.fake("iscsiadm", "-m discovery", stderr="iscsiadm: cannot make connection\n", status=4)
    done = search(box, status=255)
    assert f"system() of cmd '{DISCOVER}' failed" in done.stdout
    assert found(results) == {"/temp/vv_search/search_done": "1"}
    assert box.tree.get("/result/search") == "-1"


def test_a_missing_iscsiadm_fails_with_an_empty_list(box, results):
    box.path("/fake/bin/iscsiadm").unlink()
    box.run(["rm", "-f", "/usr/bin/iscsiadm", "/usr/sbin/iscsiadm"])
    search(box, status=255)
    assert found(results) == {"/temp/vv_search/search_done": "1"}


def test_an_output_that_cannot_be_read_leaves_the_search_undone(box, results):
    box.tree.set("/iscsi/initiator/dbg", "2")
    results.set("/temp/vv_search/search_done", "before")
    box.fake("iscsiadm", "-m discovery", effect="rm /tmp/remvol.tmp")
    done = search(box, status=255)
    assert "): end, ret = 2\n" in done.stdout
    assert found(results) == {"/temp/vv_search/search_done": "before"}


def test_a_name_that_cannot_be_stored_does_not_stop_the_others(box, results):
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a", "iqn.x:b"))
    box.hook("ktreec_set", "/temp/vv_search/id:1/name", ret=-1)
    done = search(box)
    assert "): ktreec_set() failed\n" in done.stdout
    assert found(results)["/temp/vv_search/id:2/name"] == "iqn.x:b"


def test_an_end_that_cannot_be_stored_fails_the_search(box, results):
    box.tree.set("/iscsi/initiator/dbg", "2")
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a"))
    box.hook("ktreec_set", "/temp/vv_search/search_done", ret=-1)
    done = search(box, status=255)
    assert "): ktreec_set() failed\n" in done.stdout
    assert "): end, ret = 1\n" in done.stdout


def test_a_percent_in_a_name_is_not_taken_as_it_stands(box, results):
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a%%b", "iqn.x:n%n%n%s", "iqn.x:z"))
    search(box)
    assert list(found(results).values()) == ["iqn.x:a%b", "iqn.x:n", "iqn.x:z", "1"]


def test_long_and_many_names(box, results):
    names = [f"iqn.x:{n:04}" for n in range(1000)]
    box.write("/fake/found", lines("iqn.y:" + "n" * 249, "iqn.z:" + "n" * 600, *names))
    box.fake("iscsiadm", "-m discovery", effect="cat /fake/found")
    search(box)
    values = list(found(results).values())
    assert values[:1000] == names
    assert values[1000] == "iqn.y:" + "n" * 249
    assert values[1001].startswith("iqn.z:nnn") and len(values[1001]) <= 511


def test_a_planted_link_is_not_written_through(box, results):
    box.write("/root/precious", "kept")
    box.path("/tmp/remvol.tmp").symlink_to("/root/precious")
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a"))
    search(box)
    assert box.path("/root/precious").read_text() == "kept"
    assert found(results)["/temp/vv_search/id:1/name"] == "iqn.x:a"


def test_a_link_local_portal_is_asked_through_its_interface(box, results):
    box.tree.set("/network_mgr/bonding/enable", "1")
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a", portal="[fe80::2]:3260"))
    assert box.remvol("--search", "-i", "fe80::2", "-p", "3260").status == 0
    command = "iscsiadm -m discovery -t sendtargets -p [fe80::2]:3260 -I ifbond > /tmp/remvol.tmp"
    assert box.shell() == [command]
    assert found(results)["/temp/vv_search/id:1/name"] == "iqn.x:a"


# --- with an output file ---


def test_with_an_output_file_a_private_tree_holds_the_names(box):
    private_tree(box, "search")
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:b", "iqn.x:a"))
    search(box, "-o", "/tmp/out.xml")
    assert box.trace() == daemon_road("search", f"system {DISCOVER}")
    box.wait_until(lambda: not box.path("/var/run/ktree_sock_vv_search").exists(), what="the daemon's end")
    box.wait_until(lambda: len(box.processes()) == 1, what="the end of all but the settings daemon")
    load(box, "/tmp/out.xml")
    assert box.tree.dump() == {
        "/temp/vv_search/id:1/name": "iqn.x:a",
        "/temp/vv_search/id:2/name": "iqn.x:b",
        "/temp/vv_search/search_done": "1",
    }


def test_an_output_file_that_cannot_be_written_is_told(box):
    private_tree(box, "search")
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a"))
    done = search(box, "-o", "/tmp/missing/out.xml")
    assert "): ktreec_dump(/tmp/missing/out.xml) failed\n" in done.stdout


def load(box, file):
    assert box.run(["ktreec", "-S", "/var/run/ktree_sock_vv", "-l", file], env={"LD_PRELOAD": None}).status == 0


KINDS = {"search": SEARCH, "search_lun": ("--search_lun", "-n", T1, "-c", "0", *SEARCH[1:])}


@pytest.mark.parametrize("kind, words", KINDS.items(), ids=KINDS)
def test_a_daemon_left_by_an_earlier_search_is_stopped_first(box, kind, words):
    private_tree(box, kind)
    socket = f"/var/run/ktree_sock_vv_{kind}"
    left = Tree(box, socket).start()
    left.set("/temp/left", "over")
    old = left.daemon.pid
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a"))
    box.fake("iscsiadm", "-m session", exact=True, status=4)
    box.hook("sleep", "1", effect=f"while kill -0 {old}; do sleep 0.01; done", times=1, first=True)
    box.forget()
    box.remvol(*words, "-o", "/tmp/out.xml")
    stop = f"system kill -SIGTERM `cat {socket}_config.pid`"
    calls = [call for call in box.trace() if "winshare" not in call]
    assert calls[:4] == [stop, "sleep 1", *daemon_road(kind)[:2]]
    assert calls[-1] == stop
    box.wait_until(lambda: len(box.processes()) == 1, what="the daemons' end")
    load(box, "/tmp/out.xml")
    assert box.tree.get("/temp/left") is None
    left.daemon.wait()


def test_a_left_over_socket_without_a_daemon_is_removed(box):
    private_tree(box, "search")
    box.write("/var/run/ktree_sock_vv_search", "")
    box.write("/var/run/ktree_sock_vv_search_config.pid", "99999999\n")
    box.hook("sleep", "1", times=1, first=True)
    box.fake("iscsiadm", "-m discovery", stdout=lines("iqn.x:a"))
    done = search(box, "-o", "/tmp/out.xml")
    command = "kill -SIGTERM `cat /var/run/ktree_sock_vv_search_config.pid`"
    assert f"): system() of cmd '{command}' failed\n" in done.stdout
    assert "iqn.x:a" in box.path("/tmp/out.xml").read_text()


def test_an_unreadable_output_still_ends_the_private_tree(box):
    private_tree(box, "search")
    box.fake("iscsiadm", "-m discovery", effect="rm /tmp/remvol.tmp")
    search(box, "-o", "/tmp/out.xml", status=255)
    assert box.trace()[-2:] == daemon_road("search")[-1:] + ["system winshare_reload"]
    load(box, "/tmp/out.xml")
    assert box.tree.dump() == {}


# --- LUNs of a target ---


@pytest.fixture
def initiator(box):
    initiator = Initiator(box)
    initiator.offer(T1, {0: None, 1: "sdb", 2: "sdc"})
    for device in ("sdb", "sdc"):
        box.hook("sys_get_disk_space", f"/dev/{device}", ret=SIZE)
    return initiator


def search_lun(box, *args, status=0, name=T1, chap="0"):
    done = box.remvol("--search_lun", "-n", name, "-c", chap, *args, "-i", "10.9.0.2", "-p", "3260")
    assert done.status == status, done.stdout
    return done


def luns(tree):
    values = tree.dump("/temp/vv_search_lun")
    return {path.removeprefix("/temp/vv_search_lun/"): value for path, value in values.items()}


def node_commands(box):
    return [command for command in box.shell() if "-m node" in command]


def test_a_target_that_is_not_logged_in_is_logged_in_for_the_search(box, initiator, results):
    search_lun(box)
    assert node_commands(box) == [*record_commands(T1), login_command(T1), logout_command(T1)]
    assert initiator.sessions() == []
    assert luns(results) == {
        "target_name": T1,
        "lun/id:1/lun": "1", "lun/id:1/size": str(SIZE), "lun/id:1/avaliable": "1", "lun/id:1/fstype": "unknown",
        "lun/id:2/lun": "2", "lun/id:2/size": str(SIZE), "lun/id:2/avaliable": "1", "lun/id:2/fstype": "unknown",
        "lun/count": "2",
        "err_code": "0",
    }


def test_the_whole_road_of_a_search(box, initiator, results):
    search_lun(box)
    wait, get = (f"iscsiadm -m session -P 3 >/tmp/remvol_session_{user}_lun_N.tmp 2>&1" for user in ("wait", "get"))
    calls = [re.sub(r"_lun_\d+", "_lun_N", call) for call in box.trace()]
    assert calls == [
        f"system {SESSIONS}",
        *(f"system {command}" for command in record_commands(T1)),
        f"popen {login_command(T1)}",
        f"system {SESSIONS}",
        f"system {SESSIONS}",
        "usleep 100000",
        f"system {wait}",
        f"system {get}",
        f"system {logout_command(T1)}",
    ]


def test_a_target_that_is_logged_in_stays_so(box, initiator, results):
    initiator.log_in(T1)
    store(box, T1, conn_set=1, luns=[("share2", 2)])
    search_lun(box)
    assert node_commands(box) == []
    assert initiator.sessions() == [T1]
    assert [luns(results)[f"lun/id:{k}/avaliable"] for k in (1, 2)] == ["1", "0"]


def test_the_requests_secret_goes_into_the_record(box, initiator, results):
    search_lun(box, "-U", "user", "-P", "secret", chap="1")
    assert node_commands(box)[:5] == record_commands(T1, user="user", secret="secret")


@pytest.mark.parametrize("refuse", [8, 24])
def test_a_refused_login_is_error_100(box, initiator, results, refuse):
    initiator.offer(T1, {1: "sdb"}, refuse=refuse)
    done = search_lun(box, status=255)
    assert f"): Target_Connect {T1} failed\n" in done.stdout
    assert f"): Can not find target {T1} in session\n, connect failed.\n" in done.stdout
    assert luns(results) == {"err_code": "100"}
    assert logout_command(T1) not in box.shell()


def test_a_session_that_goes_before_the_second_look_is_error_100(box, initiator, results):
    box.fake("iscsiadm", "-m session", exact=True, status=21, times=1)
    box.fake("iscsiadm", "-m session", exact=True, stdout=f"tcp: [1] 10.9.0.2:3260,1 {T1}\n", times=1)
    box.fake("iscsiadm", "-m session", exact=True, status=21)
    search_lun(box, status=255)
    assert luns(results) == {"err_code": "100"}


def test_a_failing_check_ends_the_search_without_a_code(box, initiator, results):
    box.fake("iscsiadm", "-m session", exact=True, status=4)
    done = search_lun(box, status=255)
    assert "): check_target_connected failed\n" in done.stdout
    assert luns(results) == {}
    assert node_commands(box) == []


def test_no_usable_lun_is_an_empty_result_and_logs_out(box, initiator, results):
    initiator.offer(T1, {0: None})
    search_lun(box)
    assert luns(results) == {"target_name": T1, "lun/count": "0", "err_code": "0"}
    assert initiator.sessions() == []


@pytest.mark.parametrize("good_listings", [0, 1])
def test_a_failing_listing_still_logs_out(box, initiator, results, good_listings):
    if good_listings:
        box.fake("iscsiadm", "-m session -P 3", effect="cat /fake/initiator/details/*", times=1)
    box.fake("iscsiadm", "-m session -P 3", status=4)
    done = search_lun(box, status=255)
    assert "): get session lun list failed\n" in done.stdout
    assert initiator.sessions() == []
    assert "err_code" not in luns(results)


def test_an_empty_name_ends_the_search_at_once(box):
    search_lun(box, "-o", "/tmp/out.xml", status=255, name="")
    assert box.trace() == ["system winshare_reload"]
    assert not box.path("/tmp/out.xml").exists()


def test_with_an_output_file_a_private_tree_holds_the_luns(box, initiator):
    private_tree(box, "search_lun")
    search_lun(box, "-o", "/tmp/out.xml")
    road = daemon_road("search_lun")
    assert box.trace()[:2] == road[:2] and box.trace()[-1] == road[-1]
    assert box.trace()[-2] == f"system {logout_command(T1)}"
    box.wait_until(lambda: len(box.processes()) == 1, what="the daemon's end")
    load(box, "/tmp/out.xml")
    assert box.tree.get("/temp/vv_search_lun/lun/count") == "2"
    assert box.tree.get("/temp/vv_search_lun/err_code") == "0"


def test_a_failed_search_is_dumped_as_well(box, initiator):
    private_tree(box, "search_lun")
    initiator.offer(T1, {}, refuse=24)
    search_lun(box, "-o", "/tmp/out.xml", status=255)
    load(box, "/tmp/out.xml")
    assert box.tree.dump() == {"/temp/vv_search_lun/err_code": "100"}


def test_the_end_of_a_search_is_logged(box, initiator, results):
    box.tree.set("/iscsi/initiator/dbg", "2")
    done = search_lun(box)
    texts = messages(done, "task_search_lun")
    assert texts == ["start", "end, ret = 0"]


def test_a_name_of_255_characters(box, initiator, results):
    name = BASE + "n" * (255 - len(BASE))
    initiator.offer(name, {1: "sdb"})
    search_lun(box, name=name)
    assert luns(results)["target_name"] == name
    assert luns(results)["lun/count"] == "1"


def test_an_iface_that_cannot_be_chosen_dumps_the_default_tree(box, results):
    # Only an address text of nothing has no interface; getaddrinfo never gives one, a broken resolver might.
    results.set("/some/value", "1")
    box.hook("getaddrinfo", "10.9.0.2", out="10.9.0.2")
    box.hook("inet_ntop", "AF_INET", ret=0)
    search(box, "-o", "/tmp/out.xml", status=255)
    assert box.trace()[0] == daemon_road("search")[-1]
    load(box, "/tmp/out.xml")
    assert box.tree.dump() == {"/some/value": "1"}


@pytest.mark.unsanitized
def test_a_search_that_runs_out_of_memory_says_so_and_fails(box, results):
    """Whichever allocation of the names it is; names are published whole or not at all."""
    box.fake("iscsiadm", "-m discovery", stdout=lines(*(f"iqn.2026-01.org.example:t{i:03}" for i in range(40))))
    counter = box.write("/fake/left", bytes(8))
    preload = f"{box.tools}/libpreload.so {box.tools}/libscarce.so"
    scarce = {"LD_PRELOAD": preload, "SCARCE_FILE": "/fake/left", "SCARCE_PROGRAM": "remvol"}
    short = 0
    for n in range(1, 1000):
        counter.write_bytes(n.to_bytes(8, "little"))
        done = box.remvol(*SEARCH, env=scarce)
        assert done.status in (0, 255), done
        if "out of memory for the names that 10.9.0.2 offers" in done.stdout:
            short += 1
            assert done.status == 255 and found(results) == {}
        if int.from_bytes(counter.read_bytes(), "little") > 0:
            break
        if done.status == 0:
            results.delete("/temp/vv_search")
    assert short == 3 and done.status == 0
    assert len(found(results)) == 41
