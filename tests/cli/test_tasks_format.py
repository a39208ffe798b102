"""--format and --modify."""

import pytest

from appliance import SLOTS_MOVE, assert_order, fake, hook, set_up, settings
from harness import messages
from harness.initiator import DETAILS, SHARES

LOGOUT = 'iscsiadm -m node -T "iqn.t1" --logout'
LOGIN = "iscsiadm -m node -T iqn.t1 -p 10.9.0.2:3260 -I default --login"
MKE2FS = "popen MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 -T ext4 /dev/sdb1"


def format_lun(box, name="iqn.t1", number="0"):
    return box.remvol("--format", "-n", name, "-l", number)


# What goes wrong behind a format, and exit status and state.
MOUNTS = {
    "fine": ([], 0, "0"),
    # Something else than was asked for is there afterwards.
    "unsupported": ([hook("sys_get_fs_type", "/dev/sdb1", out="reiserfs", first=True)], 255, "5"),
    "read-only": ([fake("chmod", status=1)], 255, "0"),
    "too small": ([hook("sys_get_disk_space", "/dev/sdb", ret=4096, first=True)], 255, "3"),
    "no node": ([hook("sys_check_dev", "/dev/sdb1", ret=-1, first=True)], 255, "3"),
    "not writable": ([fake("dd", status=1, first=True)], 255, "3"),
    "nothing there afterwards": ([hook("sys_get_fs_type", "/dev/sdb1", ret=1, first=True)], 255, "3"),
}


class TestFormat:
    def test_the_steps_come_in_their_order(self, volume, box):
        done = format_lun(box)
        assert (done.status, box.tree.get("/result/format")) == (0, "0")
        assert_order(
            volume.trace(),
            "set /result/format=",
            "set id:1/lun/id:1/format_progress=0",
            "set id:1/lun/id:1/status=Formatting 0%",
            "set id:1/lun/id:1/volume_state=1",
            'system umount -f "/mnt/VV/data"',
            "set id:1/lun/id:1/format_state=4",
            "set id:1/lun/id:1/format_state=1",
            MKE2FS,
            "set id:1/lun/id:1/format_progress=100",
            "set id:1/lun/id:1/format_state=0",
            'system mount -t ext4 /dev/sdb1 "/mnt/VV/data"',
            "set id:1/lun/id:1/volume_state=0",
            "set id:1/lun/id:1/status=Running",
            "set /result/format=0",
            "dump /etc/NAS_CFG/vv.xml",
            f"system {SHARES}",
        )
        assert volume.mounted("data")
        assert box.shell().count(SHARES) == 1

    def test_a_volume_without_ftp_share(self, volume, box):
        volume.debug(2)
        said = messages(format_lun(box))
        assert said.index("Can not find ftp share folder") < said.index("format partition /dev/sdb1")
        assert not any("umount_ftp" in line or "mount_ftp" in line for line in said)

    def test_an_ftp_share_goes_away_and_comes_back(self, volume, box):
        volume.mount("sdb", "/home/Public/data")
        volume.debug(1)
        said = messages(format_lun(box))
        assert_order(said, "umount_ftp : FTP SHARE PATH = /home/Public/data", "start umount ftp",
                     "mount_ftp : FTP SHARE PATH = /home/Public/data", "start mount ftp")
        assert_order(
            volume.trace(),
            'system umount -f "/home/Public/data"',
            'system umount -f "/mnt/VV/data"',
            MKE2FS,
            'system mount -t ext4 /dev/sdb1 "/mnt/VV/data"',
            f"system {SHARES}",
            "set id:1/lun/id:1/status=Running",
        )

    def test_an_ftp_share_comes_back_after_a_failure_too(self, volume, box):
        volume.mount("sdb", "/home/Public/data")
        box.fake("dd", status=1, first=True)
        assert format_lun(box).status == 255
        assert_order(volume.trace(), "set id:1/lun/id:1/volume_state=3", f"system {SHARES}",
                     "set id:1/lun/id:1/status=Formatting 0%")

    def test_a_mount_table_that_cannot_be_read(self, volume, box):
        volume.debug(2)
        # Whoever opens the table after the status was written finds none.
        box.leaks_unchecked()
        box.hook("ktreec_set", "/iscsi/initiator/id:1/lun/id:1/volume_state", value="1", through=True,
                 effect="mount -t tmpfs none /proc")
        done = format_lun(box)
        assert done.status == 255
        assert "Can not read /proc/mounts" in messages(done)
        last = [line for line in volume.trace() if "lun/id:1" in line][-1]
        assert last == "set id:1/lun/id:1/volume_state=0"
        assert not any("umount" in line or "mke2fs" in line for line in box.shell())

    @pytest.mark.parametrize("wrong, status, state", MOUNTS.values(), ids=MOUNTS)
    def test_what_the_mount_gives_is_the_result(self, volume, box, wrong, status, state):
        set_up(volume, wrong)
        assert format_lun(box).status == status
        assert volume.lun("volume_state") == state
        assert box.tree.get("/result/format") == ("0" if status == 0 else "-1")

    def refused(self, site, box, said, *more):
        before = settings(box)
        done = box.remvol("--format", *more)
        assert (done.status, [line for line in messages(done)]) == (255, said)
        assert settings(box) == before
        assert box.shell() == ["winshare_reload"]

    @pytest.mark.parametrize("name", ["iqn.t2", "x" * 255])
    def test_an_unknown_target(self, volume, box, name):
        self.refused(volume, box, [f"Can not find: {name[:255]}"], "-n", name, "-l", "0")

    @pytest.mark.parametrize("number", ["1", "4000000"])
    def test_an_unknown_lun(self, volume, box, number):
        self.refused(volume, box, [f"Can not find lun {number} under target iqn.t1"], "-n", "iqn.t1", "-l", number)

    @pytest.mark.parametrize("options", [["-n", "", "-l", "0"], ["-n", "iqn.t1", "-l", "-1"], ["-n", "iqn.t1"],
                                         ["-l", "0"], []])
    def test_missing_or_empty_options(self, volume, box, options):
        self.refused(volume, box, [], *options)

    def test_a_lun_without_a_device_is_not_touched(self, volume, box):
        volume.tree.set("/iscsi/initiator/id:1/lun/id:1/dev", "")
        volume.debug(2)
        before = settings(box)
        done = format_lun(box)
        assert done.status == 255
        assert "Can not get device" in messages(done)
        assert settings(box) == before
        assert volume.mounted("data")

    def test_an_entry_that_cannot_be_read(self, volume, box):
        box.hook("ktreec_get_wb", "/iscsi/initiator/id:1/target", through=True, effect=SLOTS_MOVE)
        box.hook("ktreec_get_wb", "/iscsi/initiator/id:1/lun/id:1/lun", ret=-1, skip=1, times=2)
        self.refused(volume, box, ["Can not get lun entry 0 under target iqn.t1"], "-n", "iqn.t1", "-l", "0")

    def test_it_logs_start_and_end(self, volume, box):
        volume.debug(2)
        said = messages(format_lun(box, number="7"))
        assert_order(said, "start", "Can not find lun 7 under target iqn.t1", "end")


class TestModify:
    @pytest.fixture
    def disconnected(self, site):
        site.store("iqn.t1", conn_set=0, conn_state=0, chap=1, chap_name="old", chap_pwd="old secret",
                   luns=[("data", 0)])
        site.offer("iqn.t1", {0: "sdb"})
        return site

    def modify(self, box, *options, name="iqn.t1"):
        return box.remvol("--modify", "-n", name, *options)

    def test_a_connected_target_is_connected_again(self, volume, box):
        done = self.modify(box, "-c", "1", "-U", "user", "-P", "a long secret")
        assert (done.status, box.tree.get("/result/modify")) == (0, "0")
        assert_order(
            volume.trace(),
            "set /result/modify=",
            'system umount -f "/mnt/VV/data"',
            f"system {LOGOUT}",
            "set id:1/conn_set=0",
            "set id:1/chap=1",
            "set id:1/chap_name=user",
            "set id:1/chap_pwd=a long secret",
            "system iscsiadm -m node -I default -T iqn.t1 -p 10.9.0.2:3260 -o delete",
            "system iscsiadm -m node -I default -T iqn.t1 -p 10.9.0.2:3260 -o new",
            'system iscsiadm -m node -I default -T "iqn.t1" -p 10.9.0.2:3260 -o update '
            '-n node.session.auth.username -v "user"',
            f"popen {LOGIN}",
            "set id:1/conn_set=1",
            f"system {DETAILS}",
            "sleep 1",
            'system mount -t ext4 /dev/sdb1 "/mnt/VV/data"',
            f"system {SHARES}",
            "set id:1/lun/id:1/status=Running",
            "set id:1/status=Connected",
            "set id:1/conn_state=1",
            "set /result/modify=0",
        )
        assert volume.mounted("data")

    def test_a_lun_that_is_deleted_while_it_is_mounted_is_unmounted(self, volume, box):
        box.hook("system", 'mount -t ext4 /dev/sdb1 "/mnt/VV/data"', through=True, times=1,
                 effect="ktreec -S /var/run/ktree_sock_vv -d /iscsi/initiator/id:1/lun/id:1")
        self.modify(box, "-c", "0")
        assert volume.lun("share") is None
        assert not volume.mounted("data")

    def test_a_target_that_is_deleted_while_it_is_connected_again_is_logged_out_alone(self, volume, box):
        volume.store("iqn.t2", slot=2, conn_set=1, luns=[("other", 0)])
        volume.offer("iqn.t2", {0: "sdd"})
        volume.log_in("iqn.t2")
        box.hook("system", 'mount -t ext4 /dev/sdb1 "/mnt/VV/data"', through=True, times=1,
                 effect="ktreec -S /var/run/ktree_sock_vv -d /iscsi/initiator/id:1")
        self.modify(box, "-c", "0")
        assert volume.sessions() == ["iqn.t2"]
        assert [line for line in box.shell() if "--logout" in line] == [LOGOUT, LOGOUT]

    def test_a_disconnected_target_stays_so(self, disconnected, box):
        assert self.modify(box, "-c", "1", "-U", "user", "-P", "secret").status == 0
        assert [disconnected.target(key) for key in ("chap", "chap_name", "chap_pwd", "conn_set", "status")] == [
            "1", "user", "secret", "0", "Disconnected"]
        assert any("-o new" in line for line in box.shell())
        assert not any("--login" in line for line in box.shell())

    def test_switching_chap_off_forgets_the_secret(self, disconnected, box):
        assert self.modify(box, "-c", "0").status == 0
        assert [disconnected.target(key) for key in ("chap", "chap_name", "chap_pwd")] == ["0", "", ""]
        assert any(line.endswith("authmethod -v None") for line in box.shell())

    def test_the_portal_and_the_luns_stay(self, disconnected, box):
        before = settings(box)
        self.modify(box, "-c", "0")
        after = settings(box)
        changed = {key for key in before if before[key] != after.get(key)}
        assert changed == {f"/iscsi/initiator/id:1/{key}" for key in ("chap", "chap_name", "chap_pwd")}

    def test_settings_that_the_target_cannot_have_are_not_stored(self, disconnected, box):
        assert self.modify(box, "-c", "1").status == 0
        assert [disconnected.target(key) for key in ("chap", "chap_name", "chap_pwd")] == ["1", "old", "old secret"]

    def test_a_reconnection_that_fails_is_not_a_failure(self, volume, box):
        volume.refuse("iqn.t1")
        done = self.modify(box, "-c", "1", "-U", "user", "-P", "wrong")
        assert (done.status, box.tree.get("/result/modify")) == (0, "0")
        assert "Reconnect failed , target name = iqn.t1" in messages(done)
        assert [volume.target(key) for key in ("conn_state", "conn_set", "status")] == ["4", "0", "Connect Error"]
        assert volume.target("chap_pwd") == "wrong"
        assert "dump /etc/NAS_CFG/vv.xml" in volume.trace()
        assert DETAILS not in [line for line in box.shell()[box.shell().index(LOGIN):]]

    @pytest.mark.parametrize("name", ["iqn.t2", "", "x" * 255])
    def test_an_unknown_target(self, disconnected, box, name):
        before = settings(box)
        done = self.modify(box, "-c", "0", name=name)
        assert (done.status, messages(done)) == (255, [f"Can not get entry from {name[:255]}"])
        assert settings(box) == before
        assert box.shell() == ["winshare_reload"]

    @pytest.mark.parametrize("options", [["-n", "iqn.t1"], ["-c", "1"], []])
    def test_a_missing_option(self, disconnected, box, options):
        before = settings(box)
        done = box.remvol("--modify", *options)
        assert (done.status, messages(done)) == (255, [])
        assert settings(box) == before

    def test_the_longest_texts_are_stored_whole(self, disconnected, box):
        assert self.modify(box, "-c", "1", "-U", "u" * 127, "-P", "p" * 127).status == 0
        assert [disconnected.target(key) for key in ("chap_name", "chap_pwd")] == ["u" * 127, "p" * 127]
