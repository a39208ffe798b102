# timeout: 300
# What scripts/demo shows, run in the virtual appliance: a remote disk becomes a shared folder, goes away, comes back.
# DEMO_TERMINAL is 1 when a person watches on a terminal, 0 when the output goes elsewhere.
PORTAL=10.9.0.2
TARGET=iqn.2026-01.org.example:photos
FOLDER=/mnt/VV/Photos
LUN_DIR=/data/luns
OUT=/tmp/demo
mkdir -p $OUT
steps=0

# ---- how it looks ----

if [ "$DEMO_TERMINAL" = 1 ]; then
    bold=$(printf '\033[1m') plain=$(printf '\033[0m')
fi

headline() {
    steps=$((steps + 1))
    say
    say "$bold$steps. $*$plain"
}

note() { say "     $*"; }

# Hundredths of a second since the appliance was switched on.
clock() {
    read -r up rest </proc/uptime
    echo $((${up%.*} * 100 + 1${up#*.} - 100))
}

seconds() { echo "$(($1 / 100)).$(($1 % 100 / 10)) s"; }

# ---- running a command and telling of it ----

began() {
    note "$ remvol $*"
    started=$(clock)
}

# ended STATUS COMMAND: remembers a line of the summary; a failure ends the demonstration.
ended() {
    took=$(($(clock) - started))
    outcome=$(result "$2")
    printf '  remvol --%-11s %8s   result %s\n' "$2" "$(seconds $took)" "$outcome" >>$OUT/summary
    if [ "$1" != 0 ]; then
        sed 's/^/     | /' $OUT/log
        fail "remvol --$2 ended with status $1"
    fi
}

run() {
    began "$@"
    status=0
    remvol "$@" >$OUT/log 2>&1 || status=$?
    ended $status "${1#--}"
}

# ---- what the administration pages would show ----

# Takes the status texts and the format's progress from the tree, as they are at this moment.
look() {
    target= volume= size= formatting= progress=
    ktreec -S $TREE_SOCKET -t /iscsi/initiator/id:1 >$OUT/tree || return 0
    while IFS='=' read -r key value; do
        case $key in
        */id:1/lun/id:1/status) volume=$value ;;
        */id:1/lun/id:1/size) size=$value ;;
        */id:1/lun/id:1/format_state) formatting=$value ;;
        */id:1/lun/id:1/format_progress) progress=$value ;;
        */id:1/status) target=$value ;;
        esac
    done <$OUT/tree
}

show_status() {
    look
    note "target: ${target:-none}, volume: ${volume:-none}"
}

bar() {
    filled=$(($1 * 40 / 100))
    line=$(printf '%*s' $filled '' | tr ' ' '#')$(printf '%*s' $((40 - filled)) '' | tr ' ' '-')
    if [ "$DEMO_TERMINAL" = 1 ]; then
        printf '\r     %8s  [%s] %3d %%' "$(seconds $(($(clock) - started)))" "$line" "$1"
        bar_open=1
    else
        printf '     %8s  [%s] %3d %%\n' "$(seconds $(($(clock) - started)))" "$line" "$1"
    fi
}

close_bar() {
    [ -z "$bar_open" ] || say
    bar_open=
}

# Shows each text once, and the progress while there is some.
show_changes() {
    look
    if [ "$target/$volume" != "$shown" ]; then
        close_bar
        printf '     %8s  target: %s, volume: %s\n' "$(seconds $(($(clock) - started)))" "$target" "$volume"
        shown=$target/$volume
    fi
    if [ "$formatting" = 1 ]; then was_formatting=1; fi
    if [ -n "$was_formatting" ] && [ "$progress" != "$shown_progress" ]; then
        bar "$progress"
        shown_progress=$progress
    fi
}

# watch OPTION...: runs the tool and shows what others see of it meanwhile.
watch() {
    shown= shown_progress= was_formatting= bar_open=
    began "$@"
    remvol "$@" >$OUT/log 2>&1 &
    running=$!
    while kill -0 $running 2>/dev/null; do
        show_changes
        sleep 0.2
    done
    status=0
    wait $running || status=$?
    show_changes
    close_bar
    ended $status "${1#--}"
}

# ---- the values of a result file ----

values() { sed -n "s|^ *<$1>\(.*\)</$1>$|\1|p" "$2"; }

# ---- the demonstration ----

say
say "${bold}A remote disk becomes a shared folder$plain"
note "This is a virtual appliance: Debian's kernel, open-iscsi, and remvol as it was just built."
note "At the other end of its network cable, at $PORTAL, a storage server offers two disks."
target_start
target_add 1 iqn.2026-01.org.example:backup
lun_add 1 1 512M
target_add 2 $TARGET
lun_add 2 1 2G
# A format that takes a while and shows its progress: mke2fs writes the inode tables itself, and the machine, small as
# an appliance, keeps little of them in its memory.
echo $((8 << 20)) >/proc/sys/vm/dirty_bytes
sed -i 's/^\[defaults\]/&\n\tlazy_itable_init = 0/' /etc/mke2fs.conf

headline "Start the initiator"
run --init

headline "Which targets does $PORTAL offer?"
run --search -i $PORTAL -p 3260 -o $OUT/targets.xml
values name $OUT/targets.xml | while read -r name; do note "$name"; done

headline "Which disks does $TARGET hold?"
run --search_lun -n $TARGET -i $PORTAL -p 3260 -c 0 -o $OUT/luns.xml
note "LUN $(values lun $OUT/luns.xml), $(values size $OUT/luns.xml) bytes, file system: $(values fstype $OUT/luns.xml)"

headline "Add it as the volume \"Photos\""
run --add -n $TARGET -l 1 -i $PORTAL -p 3260 -s Photos -c 0
show_status

headline "Connect: log in, make a partition, format, mount, share"
note "(the status texts and the progress are read from the configuration tree, as the"
note "administration pages do it)"
watch --connect -n $TARGET
note "$(df -h $FOLDER | tail -n 1)"

headline "Write a file into the folder"
echo "A picture of the sea, $(date -u +%F)" >$FOLDER/sea.txt
dd if=/dev/urandom of=$FOLDER/sea.raw bs=1M count=4 2>/dev/null
(cd $FOLDER && sha256sum sea.*) | tee $OUT/sums | sed 's/^\(................\)[0-9a-f]*/     \1.../'

headline "Status"
run --status
show_status
note "used/total bytes: $size"

headline "Disconnect"
watch --disconnect -n $TARGET
expect_not "the folder is gone" test -e $FOLDER
note "$FOLDER is gone, and so is the session: $(iscsiadm -m session 2>&1)"

headline "Connect again and read the file back"
watch --connect -n $TARGET
note "$(cat $FOLDER/sea.txt)"
(cd $FOLDER && sha256sum -c $OUT/sums >$OUT/check) || fail "the files are not what was written"
sed 's/^/     /' $OUT/check

headline "What the appliance keeps over a restart: /etc/NAS_CFG/vv.xml"
sed -n '/<iscsi>/,/<\/iscsi>/s/^/    /p' /etc/NAS_CFG/vv.xml

headline "Delete the target with its volume"
run --del -n $TARGET
show_status
note "targets left: $(tree_get /iscsi/initiator/count)"

headline "Stop the initiator"
started=$(clock)
remvol --deinit >$OUT/log 2>&1 || :
note "$ remvol --deinit"

say
say "${bold}Summary$plain"
cat $OUT/summary
say
say "  All of it ran for real: $(wc -l <$OUT/summary) commands, a disk of 2 GiB partitioned, formatted and mounted; 2 files"
say "  written, unmounted, and read back unchanged. The appliance ran $(seconds "$(clock)")."
