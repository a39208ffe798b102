# timeout: 600
# The front end for a person, against a real target: from a portal's address to a share, and what it says when it fails.
T=iqn.2026-01.org.example:t
says() { vv "$@" >/tmp/vv.out 2>/tmp/vv.err; }

# vv_works PART COMMAND...: vv succeeds and says so.
vv_works() {
    part=$1
    shift
    status=0
    says "$@" || status=$?
    [ $status = 0 ] || fail "vv $* gave status $status: $(cat /tmp/vv.out /tmp/vv.err)"
    expect_has "what vv $* says" "$part" "$(cat /tmp/vv.out)"
}

# vv_fails STATUS PART COMMAND...: vv fails and says why.
vv_fails() {
    wanted=$1 part=$2
    shift 2
    expect_status "$wanted" says "$@"
    expect_equal "what vv $* prints" "" "$(cat /tmp/vv.out)"
    expect_has "what vv $* says" "$part" "$(cat /tmp/vv.err)"
}

general_tree_start
works --init
vv_fails 1 "nothing listens at that port" discover 10.9.0.2

# From the address to the share.
target_start
target_add 1 ${T}1
for lun in 1 2; do lun_add 1 $lun 128M; done
vv_works ${T}1 discover 10.9.0.2
vv_works ${T}1 discover "[fd00:9::2]:3260"
vv_works "  1 128M" luns ${T}1 --portal 10.9.0.2
vv_works "Photos is added: LUN 1 of ${T}1" add Photos --portal 10.9.0.2 --lun 1
vv_works "Photos is mounted on /mnt/VV/Photos" connect Photos
expect_has "the steps" "logging in to ${T}1 at 10.9.0.2:3260" "$(cat /tmp/vv.err)"
expect "it is mounted" mounted Photos
echo "a photo" >/mnt/VV/Photos/photo
vv_works "all 1 healthy" status
vv_works "  1 128M ext4   Photos" luns ${T}1
vv_works "  1 128M ext4   Photos" luns Photos
remvol-notify
mount -o remount,ro /mnt/VV/Photos
vv_fails_status() { vv status >/tmp/vv.out 2>&1; }
expect_status 1 vv_fails_status
expect_has "what is to be done" "    vv disconnect Photos && vv connect Photos" "$(cat /tmp/vv.out)"
sed -n 's/^    vv /vv /p' /tmp/vv.out >/tmp/command
expect "what is to be done helps" sh -e /tmp/command
expect "it is healthy again" vvstat -x

# A second LUN is there at once.
vv_works "Grüße aus Köln is mounted on /mnt/VV/Grüße aus Köln" add "Grüße aus Köln" --portal 10.9.0.2 --lun 2
vv_fails 4 "no terminal to ask at" disconnect Photos
expect "nothing was changed" mounted Photos
vv_works "Photos is disconnected" disconnect Photos --yes
expect_not "the target is gone" logged_in ${T}1
vv_works "Photos is mounted on" connect ${T}1
expect_equal "the photo" "a photo" "$(cat /mnt/VV/Photos/photo)"

# A target that asks for a password, at a portal that offers two.
target_add 2 ${T}2
lun_add 2 1 128M
target_chap 2 maria secret-of-12-
vv_fails 2 "--target ${T}2" add Archive --portal 10.9.0.2 --lun 1
vv_fails 1 "the target refused the user name or the password" luns ${T}2 --portal 10.9.0.2
echo secret-of-13- >/tmp/password
vv_works "Archive is added" add Archive --portal 10.9.0.2 --lun 1 --target ${T}2 --user maria --password-file /tmp/password
vv_fails 1 "the target refused the user name or the password" connect Archive
expect_not "no session" logged_in ${T}2
echo secret-of-12- >/tmp/password
vv_works "the password is stored" password Archive --user maria --password-file - </tmp/password
vv_works "Archive is mounted on /mnt/VV/Archive" connect Archive
expect_lacks "the log of the machine" secret-of-12- "$(cat /tmp/vv.out /tmp/vv.err /tmp/remvol.out)"

# What destroys is asked for twice.
echo text >/mnt/VV/Archive/text
vv_fails 4 "Archive carries data: ext4 on $(disk_of ${T}2 1)1" format Archive --yes
vv_fails 4 "no terminal to ask at" format Archive --destroy-data
expect_equal "the file" text "$(cat /mnt/VV/Archive/text)"
vv_works "Archive is mounted on /mnt/VV/Archive" format Archive --destroy-data --yes
expect_not "the file is gone" test -e /mnt/VV/Archive/text
expect "everybody may write" touch /mnt/VV/Archive/new

# Another portal.
vv_fails 1 "vv disconnect Archive" rename-portal Archive --portal 10.9.1.2
vv_works "Archive is disconnected" disconnect Archive
vv_fails 1 "the storage server's machine does not answer" rename-portal Archive --portal 10.9.1.77
vv_works "Archive is reached at 10.9.1.2:3260" rename-portal Archive --portal 10.9.1.2
vv_works "Archive is mounted" connect Archive
expect "the file is there" test -e /mnt/VV/Archive/new

# A file system that the kernel cannot mount: it says why.
vv_works "Archive is disconnected" disconnect Archive
dd if=/dev/zero of="$(lun_file 2 1)" bs=4k seek=257 count=4 conv=notrunc 2>/dev/null
vv_fails 1 "step: mount" connect Archive
expect_has "what the kernel says" "said: kernel: EXT4-fs ($(disk_of ${T}2 1)1): " "$(cat /tmp/vv.err)"

# A target that does not answer any more, and a LUN that the storage server takes away.
vv_works "Photos is deleted" delete Photos --yes
expect_not "it is not mounted" mounted Photos
expect_has "the other one" '/mnt/VV/Grüße\040aus\040Köln ' "$(cat /proc/mounts)"
vv_works "is disconnected" disconnect "Grüße aus Köln"
lun_delete 1 2
vv_fails 1 "still offers" connect "Grüße aus Köln"
target_kill
vv_fails 1 "nothing listens at that port" discover 10.9.0.2
vv_fails 1 "step: login" connect "Grüße aus Köln"
vv_works "is deleted" delete ${T}1 --yes
expect_status 1 says status
