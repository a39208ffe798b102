# timeout: 7200
# The appliance's side of the rounds on real disks (disks.py): eight targets with two LUNs each, and the runs of a round
# as the runner wants them.
T=iqn.2026-01.org.example:t
STORM=/tmp/storm
SETTINGS="/etc/NAS_CFG/vv.xml /usr/local/config/vv.xml"
PARTITION="?offset=1048576"
SIZE=16M

# Each target has an address of its own. LUN 3 belongs to somebody else: no command names it.
start_targets() {
    ip addr del 10.9.0.1/24 dev egiga0
    ip addr add 10.9.0.100/24 dev egiga0
    target_start
    for t in 1 2 3 4 5 6 7 8; do
        ip -n target addr add 10.9.0.$t/24 dev t0
        target_add $t $T$t
        target_chap $t user$t secret${t}secret$t
        for lun in 1 2; do lun_add $t $lun $SIZE; done
        mkdir -p $LUN_DIR
        yes "somebody else's $t" | head -c 1M >"$(lun_file $t 3)"
        lun_add $t 3 1M
    done
}

# template: a disk as the tool makes one.
template() {
    works --init
    works --add -n ${T}1 -l 1 -i 10.9.0.1 -p 3260 -s template -c 1 -U user1 -P secret1secret1
    works --connect -n ${T}1
    works --del -n ${T}1
    cp "$(lun_file 1 1)" /tmp/template
}

# fill TARGET LUN STAMP: the LUN gets a file system with its mark and some text.
fill() {
    echo "$1 $2 $3" >/tmp/mark
    yes "text of LUN $2 of t$1" | head -c 64K >/tmp/text
    cp /tmp/template "$(lun_file "$1" "$2")"
    printf 'write /tmp/mark .data\nwrite /tmp/text text\n' >/tmp/commands
    debugfs -w -f /tmp/commands "$(lun_file "$1" "$2")$PARTITION"
}

# blank TARGET LUN: nobody has ever written to it.
blank() { truncate -s 0 "$(lun_file "$1" "$2")" && truncate -s $SIZE "$(lun_file "$1" "$2")"; }

# look_at_luns STAMP: what is on the disks while nobody is logged in.
look_at_luns() {
    for t in 1 2 3 4 5 6 7 8; do
        for lun in 1 2; do
            file=$(lun_file $t $lun)
            checked=0
            e2fsck -fn "$file$PARTITION" >/tmp/fsck 2>&1 || checked=$?
            echo "disk $t $lun $checked $(head -c 1M "$file" | md5sum | cut -c 1-32)" \
                "$(debugfs -R "cat text" "$file$PARTITION" 2>/dev/null | md5sum | cut -c 1-32)" \
                "$(debugfs -R "cat .data" "$file$PARTITION" 2>/dev/null)"
            [ $checked = 0 ] || sed "s/^/fsck $t $lun /" /tmp/fsck
        done
        echo "witness $t $(md5sum <"$(lun_file $t 3)")"
    done
}

# ---- a round ----

# now: hundredths of a second since the boot.
now() {
    read -r up rest </proc/uptime
    echo "${up%.*}${up#*.}"
}

# at HUNDREDTHS: waits until so long after the round's beginning.
at() {
    left=$((began + $1 - $(now)))
    [ $left -le 0 ] || sleep $((left / 100)).$(printf %02d $((left % 100)))
}

# begin NUMBER COMMAND...: a run that is not waited for, in a process group of its own.
begin() {
    number=$1
    shift
    (
        from=$(now)
        setsid "$@" >$STORM/$number.out 2>&1 </dev/null &
        echo $! >$STORM/$number.pid
        status=0
        wait $! || status=$?
        echo "$number $from $(now) $status" >$STORM/$number.new
        mv $STORM/$number.new $STORM/$number.end
    ) &
}

# end NUMBER [GROUP]: kills a run, or all of its group.
end() { kill -9 "${2:+-}$(cat $STORM/$1.pid)"; }

# restart SECONDS COMMAND...: the tree's daemon dies, and is started again so long afterwards.
restart() {
    gone=$(now)
    kill -9 "$(cat /var/run/ktree_sock_vv_config.pid)"
    sleep "$1"
    shift
    setsid "$@" >/dev/null 2>&1 </dev/null &
    wait_for 60 tree_answers $TREE_SOCKET
    echo "$gone $(now)" >>$STORM/downtimes
}

# tree_answers SOCKET
tree_answers() {
    answer=0
    ktreec -S "$1" -g / || answer=$?
    [ $answer != 3 ]
}

# lun_behind NODE: sets the target's number and the LUN's behind /dev/sdX1, without a process of its own.
lun_behind() {
    behind=${1#/dev/}
    behind=/sys/block/${behind%1}/device
    target=0 lun=0
    for name in "$behind"/../../iscsi_session/*/targetname; do
        read -r target <"$name" && target=${target#"$T"}
    done 2>/dev/null
    for name in "$behind"/scsi_device/*; do lun=${name##*:}; done
}

# watch: whose disk is seen under which share's name, as long as the round lasts.
watch() {
    until [ -e $STORM/over ]; do
        while read -r node point rest; do
            case $point in /mnt/VV/*) ;; *) continue ;; esac
            lun_behind "$node"
            case $target in [1-8]) ;; *) continue ;; esac
            seen="${point##*/} $target $lun"
            grep -qs "^$node $point " /proc/mounts && [ "$seen" != "$last" ] && echo "$seen" >>$STORM/seen
            last=$seen
        done </proc/mounts
        sleep 0.3
    done
}

# storm: plays the round that stands in /tmp/round.
storm() {
    rm -rf $STORM
    mkdir $STORM
    : >$STORM/downtimes
    : >$STORM/seen
    (
        watch &
        began=$(now)
        . /tmp/round
        echo 1 >$STORM/begun
    ) >$STORM/log 2>&1 9>&- &
}

# under_way: the numbers of the runs that have not ended, and what else is at work.
under_way() {
    [ -e $STORM/begun ] || echo "beginning"
    for file in $STORM/*.pid; do
        [ ! -e "$file" ] || [ -e "${file%.pid}.end" ] || echo "${file##*/}"
    done
    ps -e -o comm= -o pid= -o args= | awk '$1 ~ /^(remvol|iscsiadm|mke2fs|e2fsck|mount|umount|dd|fuser|flashrun)$/'
}

over() {
    touch $STORM/over
    cat $STORM/*.end | sed 's/^/end /'
    sed 's/^/down /' $STORM/downtimes
    sort -u $STORM/seen | sed 's/^/seen /'
}

said() { for file in $STORM/*.out; do sed "s/^/${file##*/}: /" "$file"; done; }

# report: what the appliance says and shows.
report() {
    ktreec -S $TREE_SOCKET -t /iscsi/initiator
    for name in /sys/class/iscsi_session/*/targetname; do
        [ ! -e "$name" ] || sed "s/^$T/session /" "$name"
    done
    for disk in /sys/block/sd*; do
        [ -e "$disk" ] || continue
        lun_behind "${disk##*/}"
        echo "lun ${disk##*/} $target $lun"
    done
    while read -r node point rest; do
        case $point in /mnt/VV/*) ;; *) continue ;; esac
        lun_behind "$node"
        echo "mount $point $node $target $lun $(cat "$point/.data" 2>/dev/null)"
    done </proc/mounts
    for folder in /mnt/VV/*; do [ ! -e "$folder" ] || echo "folder ${folder##*/}"; done
    for set in $(ipcs -s | awk '/^0x/ { print $2 }'); do ipcs -s -i "$set" | awk '$1 == "0" { print "semaphore", $2 }'; done
}

# settings_report: the settings file and its flash copy, loaded into trees of their own.
settings_report() {
    for file in $SETTINGS; do
        [ -e "$file" ] || { echo "missing $file" && continue; }
        ktree -n config -s /run/other >/dev/null 2>&1 &
        other=$!
        until tree_answers /run/other >/dev/null 2>&1; do sleep 0.1; done
        ktreec -S /run/other -l "$file" >/tmp/loading 2>&1 && echo "loaded $file" || echo "damaged $file $(cat /tmp/loading)"
        ktreec -S /run/other -t /iscsi/initiator | sed "s,^,$file ,"
        kill -9 $other
        wait $other || [ $? = 137 ] || return  # by the kill, not by itself before
    done
}
