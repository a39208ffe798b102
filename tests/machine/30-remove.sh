# timeout: 900
# after: installed
# The package is removed, installed again and purged while its volumes are in use.
expect_nothing_runs() {
    expect_equal "mounted volumes" "" "$(grep /mnt/VV/ /proc/mounts)"
    expect_equal "sessions" "" "$(sessions)"
    expect_not "the initiator runs" pgrep -x iscsid
    expect_not "the tree runs" pgrep -x ktree
    expect_lacks "the kernel's words" "I/O error" "$(dmesg)"
    expect_lacks "the kernel's words" "detected conn error" "$(dmesg)"
    expect_not "a share is left" grep -qs '^\[' /run/remvol/smb-shares.conf
    expect_equal "failed units" "" "$(systemctl list-units --failed --no-legend --plain)"
}

# as_before FILE: a file of open-iscsi is what its package brought, not what ours wrote.
as_before() { expect_not "$1 is ours" grep -q -e 'replacement_timeout = 30$' -e 'iqn\.2013-03' "$1"; }

# Where the secret lies: in the settings, their copy and the target's record, for root alone.
with_secret() { grep -rl s3cr3tw0rd /etc /usr/local /var /run /tmp /root /home 2>/dev/null | sort; }

remvol -d 3 >/dev/null
for command in "--modify -n $IQN:t1 -c 1 -U maria -P s3cr3tw0rd" "--connect -n $IQN:t1" --status; do
    # shellcheck disable=SC2086 # words
    expect "remvol $command" systemd-cat -t remvol remvol $command
done
remvol -d 0 >/dev/null
wait_for 30 mounted Photos
records=$(find /etc/iscsi/nodes /var/lib/iscsi/nodes -path "*$IQN:t1*" -type f 2>/dev/null)
expect_equal "the target's records" 1 "$(printf '%s\n' "$records" | grep -c .)"
expect_equal "files with the secret" "$(printf '%s\n' /etc/NAS_CFG/vv.xml "$records" /usr/local/config/vv.xml | sort)" "$(with_secret)"
with_secret | while read -r file; do
    expect_equal "the mode of $file" "600 root root" "$(stat -c '%a %U %G' "$file")"
done || exit 1
expect_has "the journal at level 3" "arg[9]: '***'" "$(journalctl --no-pager -b -t remvol)"
expect_lacks "the journal" s3cr3tw0rd "$(journalctl --no-pager -b -o export)"
mkdir -p /var/lib/prometheus/node-exporter
systemctl enable --now remvol-metrics.timer
systemctl start remvol-metrics.service
sh -c 'while date; do sleep 0.2; done >/mnt/VV/Photos/busy 2>/dev/null' &
ends_in_order apt_quiet remove remvol
expect_nothing_runs
as_before /etc/iscsi/iscsid.conf
as_before /etc/iscsi/initiatorname.iscsi
expect_not "the metrics' timer runs" systemctl -q is-active remvol-metrics.timer
expect_not "metrics are left" test -e /var/lib/prometheus/node-exporter/remvol.prom
expect "the settings are there" grep -q Photos /etc/NAS_CFG/vv.xml

works_again() { expect_equal "the file" "text of Photos" "$(cat /mnt/VV/Photos/file)"; }
install_packages
wait_for 30 mounted Photos
works_again

apt_quiet purge remvol libremvol1 || fail "the package is not purged"
expect_nothing_runs
as_before /etc/iscsi/iscsid.conf
as_before /etc/iscsi/initiatorname.iscsi
expect_equal "secrets that are left" "" "$(grep -rl s3cr3tw0rd /etc /usr/local /var/lib /run /tmp 2>/dev/null)"
expect_equal "settings that are left" "" "$(ls -d /etc/NAS_CFG /usr/local/config/vv.xml 2>/dev/null)"
expect_equal "node records that are left" "" "$(find /etc/iscsi/nodes /etc/iscsi/send_targets /var/lib/iscsi -type f 2>/dev/null)"
expect_equal "loaded modules" "" "$(grep -o '^[a-z_]*iscsi[a-z_]*' /proc/modules)"
expect_equal "files of the tool" "" "$(ls -d /tmp/remvol*.tmp /var/lock/virtual_volume /run/remvol 2>/dev/null)"

install_packages
expect_equal "volumes that came back" "" "$(ktreec -S $TREE_SOCKET -t | grep share=)"
booted
