# needs: package
# The Debian packages are installed, started, used, stopped and removed. There is no service manager here: the lines
# of the units are run as they stand, with the capabilities that the units leave them.
units=/lib/systemd/system

# unit NAME KEY: the values of a unit.
unit() { cat "$units/$1.service" "$units/$1.service.d"/*.conf 2>/dev/null | sed -n "s/^$2=-\?//p"; }

# as_unit NAME KEY: runs the command of a unit, of several the last one.
as_unit() {
    capabilities=$(unit "$1" CapabilityBoundingSet | tr 'A-Z ' 'a-z\n' | sed -n 's/^cap_/,+/p' | tr -d '\n')
    [ "$(unit "$1" LimitMEMLOCK)" != infinity ] || ulimit -l unlimited
    # shellcheck disable=SC2046 # a list
    exec setpriv --no-new-privs --bounding-set "-all$capabilities" $(unit "$1" "$2" | tail -n 1)
}

start() {
    (as_unit remvol-tree ExecStart) &
    (as_unit remvol-general-tree ExecStart) &
    wait_for 10 test -S $TREE_SOCKET
    wait_for 10 test -S /var/run/ktree_sock
    /usr/lib/remvol/modules
    (as_unit remvol ExecStart)
    expect_equal "the result of the start" 0 "$(result init)"
    expect_equal "the capabilities of the tree" 0000000000000000 \
        "$(sed -n 's/^CapBnd:[[:space:]]*//p' "/proc/$(cat /var/run/ktree_sock_vv_config.pid)/status")"
    (as_unit remvol-events ExecStart) &
    listener=$!
}

tree_is_gone() { ! pgrep -x ktree; }

stop() {
    kill $listener
    wait $listener || : # 143 when it had not begun to listen
    winshare_reload --withdraw
    expect_not "a share is left" grep '^\[' /run/remvol/smb-shares.conf
    (as_unit remvol ExecStop)
    kill "$(cat /run/ktree_sock_config.pid)"
    wait_for 10 tree_is_gone
    expect_equal "what is mounted" "" "$(grep /mnt/VV/ /proc/mounts)"
    expect_status 21 iscsiadm -m session
}

expect_not "the project is here already" command -v remvol
rm -r /usr/local/modules
mkdir /var/log
target_start
target_add 1 $IQN:t1
lun_add 1 1 64M

expect "the packages are installed" dpkg -i /packages/*.deb
for program in ktree ktreec remvol remvol-events remvol-keeper remvol-notify vvstat winshare_reload macshare_reload flashrun; do
    expect "$program is in its place" test -x /usr/bin/$program
done
start
volume_add t1 1 Photos
works --connect -n $IQN:t1
works --search -i 10.9.0.2 -p 3260
expect_equal "what the portal offers" $IQN:t1 "$(ktreec -S /var/run/ktree_sock -g /temp/vv_search/id:1/name)"
echo text >/mnt/VV/Photos/file
expect_has "what the operator sees" Running "$(vvstat)"
stop

start
expect_equal "the file after a start" text "$(cat /mnt/VV/Photos/file)"
stop

expect "the packages are removed" dpkg -r remvol libremvol1
expect_equal "what is left of the programs" "" "$(ls /usr/bin/remvol* /usr/bin/ktree* /usr/lib/remvol $units/remvol* 2>/dev/null)"
expect_not "the module folder is gone" test -e /usr/local/modules
expect "the settings are there" grep -q Photos /etc/NAS_CFG/vv.xml
expect "so is their copy" grep -q Photos /usr/local/config/vv.xml
expect_equal "the user's data" text "$(debugfs -R 'cat file' "$(lun_file 1 1)?offset=1048576" 2>/dev/null)"
