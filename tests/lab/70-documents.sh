# timeout: 600
# needs: samba
# brings: README.md docs/operators-guide.md docs/tree-layout.md docs/settings-file.md docs/lab.md docs/man/remvol.8
# brings: docs/man/vv.8 docs/man/ktreec.1 docs/man/flashrun.8 docs/man/winshare_reload.8 docs/man/remvol-shares.conf.5
# What the documents tell a person to type works as it stands there, and prints what they say.

# block FILE START: the block of a document or manual page whose first line begins so.
block() {
    sed 's/\\-/-/g; s/\\e/\\/g' "/brought/$1" >/tmp/document
    awk -v start="$2" '
        /^```/ || /^\.EX/ || /^\.EE/ { inside = !inside; first = 1; next }
        inside && first { first = 0; found = index($0, start) == 1 }
        inside && found' /tmp/document >/tmp/block
    [ -s /tmp/block ] || fail "$1 has no block that begins with '$2'"
}

# run_block FILE START [SED]: runs a block's commands, changed by the sed command, which all must succeed.
run_block() {
    block "$1" "$2"
    sed "${3:-}" /tmp/block >/tmp/commands
    say "$1: $2"
    status=0
    sh -e /tmp/commands </dev/null >/tmp/printed 2>&1 || status=$?
    [ $status = 0 ] || {
        cat /tmp/printed
        fail "$1: the block that begins with '$2' gave status $status"
    }
}

# run_dialogue FILE START: the commands behind the prompts print what stands below them. The clock may be another.
run_dialogue() {
    block "$1" "$2"
    say "$1: $2"
    sed -n 's/^# //p' /tmp/block >/tmp/commands
    status=0
    while read -r command; do
        echo "# $command"
        (exit $status)
        eval "$command"
        status=$?
    done </tmp/commands 2>&1 | sed 's/as of ..:..:../as of 12:34:56/' >/tmp/printed
    [ "$(cat /tmp/block)" = "$(cat /tmp/printed)" ] || {
        cat /tmp/printed
        fail "$1: the dialogue that begins with '$2' is another"
    }
}

# forget_all: no target is configured any more.
forget_all() {
    while name=$(target_key 1 target) && [ -n "$name" ]; do works --del -n "$name"; done
}

# stop_all: nothing runs any more, neither here nor at the target.
stop_all() {
    forget_all
    expect "stop" remvol --deinit >/dev/null 2>&1
    target_kill
}

cd /tmp
target_start
target_add 1 $IQN:t1
lun_add 1 1 256M
lun_add 1 2 64M
# The guide, "Where there is no systemd".
ktree -n config -s /var/run/ktree_sock &
remvol --init
remvol-events &
events=$!
remvol-keeper &
keeper=$!

run_block README.md "vv discover"
run_dialogue README.md "# vvstat"
run_dialogue docs/operators-guide.md "# vvstat"
block docs/tree-layout.md "# ktreec -S /var/run/ktree_sock_vv -t"
ktreec -S /var/run/ktree_sock_vv -t >/tmp/tree
sed 1d /tmp/block | while read -r line; do
    grep -qxF -e "$line" /tmp/tree || {
        cat /tmp/tree
        fail "the tree of docs/tree-layout.md: no $line"
    }
done || exit 1
run_dialogue docs/tree-layout.md "# ktreec -S /var/run/ktree_sock_vv -g"
tree_set /iscsi/initiator/dbg 0
run_block docs/man/flashrun.8 "flashrun"
run_block docs/operators-guide.md "partition=" "s/fsck -f/& -p/; s/TARGET/$IQN:t1/"
expect "the volume is back" mounted Photos

say "the file servers' part"
mkdir -p /etc/samba /var/lib/samba/private /var/cache/samba /var/log/samba /run/samba /etc/remvol
block docs/operators-guide.md "   force user"
{ echo "[global]" && cat /tmp/block; } >/etc/samba/smb.conf
block docs/man/winshare_reload.8 "[global]"
cat /tmp/block >>/etc/samba/smb.conf
block docs/operators-guide.md "[Photos]"
cp /tmp/block /etc/remvol/shares.conf
run_block docs/operators-guide.md "winshare_reload"
run_block docs/man/winshare_reload.8 "winshare_reload"
expect_has "what Samba makes of it" "valid users = maria @family" "$(cat /tmp/printed)"
expect_has "what Samba makes of [global]" "force user = nobody" "$(cat /tmp/printed)"
expect_lacks "what Samba does not know" "nknown parameter" "$(cat /tmp/printed)"
block docs/man/remvol-shares.conf.5 "[Accounts]"
cp /tmp/block /etc/remvol/shares.conf
run_block docs/man/remvol-shares.conf.5 "winshare_reload"
expect_lacks "what is said of the list" "stay as they are" "$(cat /tmp/printed)"
rm /etc/remvol/shares.conf

forget_all
run_block docs/operators-guide.md "vv discover"
forget_all
run_block docs/man/remvol.8 "remvol --search"
forget_all
echo secret >/root/password
chmod 600 /root/password
run_block docs/man/vv.8 "vv discover"

kill $events $keeper
stop_all
say "the example of docs/lab.md"
block docs/lab.md "# timeout: 100"
. /tmp/block
cable_plug 0
stop_all

say "a tree of one target"
ktree -n config -s /var/run/ktree_sock_vv &
wait_for 10 tree_set /iscsi/initiator/ver 1
tree_set /iscsi/initiator/id:1/target $IQN:t1
printf '<?xml version="1.0"?>\n<config>\n <iscsi>\n </config>\n' >broken.xml
run_dialogue docs/man/ktreec.1 "# ktreec"
run_dialogue docs/settings-file.md "# ktreec"
