# --system_off and --deinit leave nothing running; the appliance starts and stops twice from one script.
nothing_left() {
    ! pgrep -x iscsid && ! pgrep -x ktree && [ ! -e /var/run/ktree_sock_vv ] &&
        [ ! -e /var/run/ktree_sock_vv_config.pid ] && [ -z "$(ls /mnt/VV)" ] && [ -z "$(sessions)" ] &&
        ! grep -q /mnt/VV /proc/self/mounts
}
modules() { grep -c -e ^iscsi_tcp -e ^libiscsi -e ^scsi_transport_iscsi /proc/modules; }

target_start
expect "target" target_add 1 $IQN:t1
expect "LUN" lun_add 1 1 64M
works --init
volume_add t1 1 Data
works --connect -n $IQN:t1
echo text >/mnt/VV/Data/file

expect "system_off" remvol --system_off
wait_for 5 nothing_left
expect_equal "modules stay loaded" 4 "$(modules)"

works --init
expect "the volume is back" mounted Data
expect_equal "its file" text "$(cat /mnt/VV/Data/file)"

expect "deinit" remvol --deinit
wait_for 5 nothing_left
expect_equal "modules are gone" 0 "$(modules)"
expect_equal "shells that live on" 1 "$(pgrep -fc '^sh /brought/scenario')"

works --init
expect "the volume is back" mounted Data
expect_equal "its file" text "$(cat /mnt/VV/Data/file)"
expect "deinit" remvol --deinit
wait_for 5 nothing_left
