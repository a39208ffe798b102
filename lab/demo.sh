# needs: samba
# timeout: 300
# What scripts/demo shows, run in the virtual appliance: a remote disk becomes a shared folder, a client on another machine
# saves a photo in it, the cable to the storage is cut and put back, and nothing is lost.
# DEMO_TERMINAL is 1 when a person watches on a terminal, 0 when the output goes elsewhere.
PORTAL=10.9.0.2
TARGET=iqn.2026-01.org.example:photos
DESK=192.168.7.2
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

note() { say "   $*"; }

indent() { sed 's/^/   /'; }

# Hundredths of a second since the appliance was switched on.
clock() {
    read -r up rest </proc/uptime
    echo $((${up%.*} * 100 + 1${up#*.} - 100))
}

seconds() { echo "$(($1 / 100)).$(($1 % 100 / 10)) s"; }

# begin, took: the time since then. The status is shown anew.
begin() { started=$(clock) shown=; }

took() { seconds $(($(clock) - started)); }

# remember TEXT TIME: a line of the summary.
remember() { printf '  %-50s %8s\n' "$1" "$2" >>$OUT/summary; }

# ---- running a command and telling of it ----

# run COMMAND...: shows the command; a failure ends the demonstration.
run() {
    note "$ $*"
    "$@" >$OUT/log 2>&1 || broken "$@"
}

broken() {
    indent <$OUT/log
    fail "this failed: $*"
}

# show COMMAND...: shows the command and what it prints, whatever it thinks of the volumes.
show() {
    note "$ $*"
    "$@" | indent
}

# ---- the live status ----

bar() {
    filled=$(($1 * 40 / 100))
    line=$(printf '%*s' $filled '' | tr ' ' '#')$(printf '%*s' $((40 - filled)) '' | tr ' ' '-')
    if [ "$DEMO_TERMINAL" = 1 ]; then
        printf '\r   %8s  Photos  [%s] %3d %%' "$(took)" "$line" "$1"
        bar_open=1
    else
        printf '   %8s  Photos  [%s] %3d %%\n' "$(took)" "$line" "$1"
    fi
}

close_bar() {
    [ -z "$bar_open" ] || say
    bar_open=
}

# Shows what vvstat says of the volume, once each; a format as a bar.
show_status() {
    now=$(vvstat -no SHARE,STATUS,USED,SIZE)
    [ "$now" != "$shown" ] || return 0
    shown=$now
    case $now in
    *"Formatting "[0-9]*)
        percent=${now##*Formatting }
        bar "${percent%%%*}"
        ;;
    *)
        close_bar
        printf '   %8s  %s\n' "$(took)" "$now"
        ;;
    esac
}

# watch COMMAND...: runs it and shows the status meanwhile.
watch() {
    bar_open=
    note "$ $*"
    "$@" >$OUT/log 2>&1 &
    running=$!
    while kill -0 $running 2>/dev/null; do
        show_status
        sleep 0.2
    done
    wait $running || broken "$@"
    show_status
    close_bar
}

# watch_until COMMAND...: shows the status until the command succeeds, a minute at most.
watch_until() {
    limit=$(($(clock) + 6000))
    until "$@"; do
        show_status
        [ "$(clock)" -lt $limit ] || fail "waited a minute for '$*'"
        sleep 0.2
    done
    show_status
}

is_lost() { ! vvstat -x >/dev/null; }
is_well() { vvstat -x >/dev/null; }
is_mailed() { [ -s $OUT/mail ]; }

# ---- the other machines ----

# The desk is on a cable of its own: the one that is cut leads to the storage server alone.
desk_up() {
    ip -batch - <<END
netns add desk
link add lan0 type veth peer name d0 netns desk
addr add 192.168.7.1/24 dev lan0
link set lan0 up
END
    ip -n desk addr add $DESK/24 dev d0
    ip -n desk link set d0 up
    printf 'username = maria\npassword = secret\n' >$OUT/maria
}

# at_desk COMMANDS: what smbclient does at the desk in the share.
at_desk() {
    (cd $OUT && nsenter --net=/run/netns/desk smbclient //192.168.7.1/Photos -A $OUT/maria -t 60 -c "$1" >$OUT/log 2>&1) ||
        broken smbclient "$1"
}

samba_up() {
    mkdir -p /etc/samba /var/lib/samba/private /var/cache/samba /var/log/samba /run/samba
    printf '[global]\n   load printers = no\n   disable spoolss = yes\n   include = /run/remvol/smb-shares.conf\n' >/etc/samba/smb.conf
    printf '%s\n' nobody:x:65534:65534::/:/bin/false maria:x:1000:1000::/:/bin/false >>/etc/passwd
    printf '%s\n' nogroup:x:65534: maria:x:1000: >>/etc/group
    printf 'secret\nsecret\n' | smbpasswd -s -a maria >/dev/null
    smbd -D
}

# No mail leaves this machine: what would be sent is kept.
mail_up() {
    mkdir -p /etc/remvol
    echo "MAILADDR admin@example.org" >/etc/remvol/remvol.conf
    printf '#!/bin/sh\ncat >%s/mail.new && mv %s/mail.new %s/mail\n' $OUT $OUT $OUT >/usr/sbin/sendmail
    chmod 755 /usr/sbin/sendmail
}

# ---- the demonstration ----

say
say "${bold}A remote disk becomes a shared folder, and outlives a cut cable$plain"
note "This is a virtual appliance: Debian's kernel, open-iscsi, Samba, and remvol as it was just built."
note "A storage server at $PORTAL is on one network cable, a desk at $DESK on another."
desk_up
samba_up &
mail_up
target_start
target_add 1 iqn.2026-01.org.example:backup
lun_add 1 1 512M
target_add 2 $TARGET
lun_add 2 1 2G
# A format that takes a while and shows its progress: mke2fs writes the inode tables itself, and the machine, small as
# an appliance, keeps little of them in its memory.
echo $((8 << 20)) >/proc/sys/vm/dirty_bytes
sed -i 's/^\[defaults\]/&\n\tlazy_itable_init = 0/' /etc/mke2fs.conf

headline "Start, and see what the storage server offers"
run remvol --init
remvol-events >/dev/null 2>&1 &
events=$!
remvol-keeper >/dev/null 2>&1 &
keeper=$!
run remvol --search -i $PORTAL -p 3260 -o $OUT/targets.xml
sed -n 's|^ *<name>\(.*\)</name>$|\1|p' $OUT/targets.xml | indent

headline "Make the volume \"Photos\" of one of its disks, and watch it come"
begin
run remvol --add -n $TARGET -l 1 -i $PORTAL -p 3260 -s Photos -c 0
watch remvol --connect -n $TARGET
remember "a remote disk of 2 GiB formatted, mounted, shared" "$(took)"

headline "Somebody at the desk saves a photo"
wait_for 30 smbcontrol smbd ping
dd if=/dev/urandom of=$OUT/sea.jpg bs=1M count=4 2>/dev/null
(cd $OUT && sha256sum sea.jpg >sums)
begin
at_desk "put sea.jpg"
remember "a photo of 4 MiB saved from another machine" "$(took)"
note "$DESK $ smbclient //192.168.7.1/Photos -c 'put sea.jpg'   $(took)"
note "sha256 $(cut -c 1-32 $OUT/sums)..."
show vvstat

headline "The cable to the storage server is cut"
begin
cable_cut 0
watch_until is_lost
remember "cable cut: the status said so after" "$(took)"
watch_until is_mailed
remember "                 and a warning was mailed after" "$(took)"
note "This would have been mailed:"
sed -n -e '/^To:/p' -e '/^Subject:/p' -e '/^Volume/p' $OUT/mail | fold -s -w 90 | sed 's/^/   | /'
show vvstat

headline "The cable is put back, and nobody touches anything"
begin
cable_plug 0
watch_until is_well
remember "cable back: healthy again, by itself, after" "$(took)"

headline "The photo, as the desk sees it"
rm $OUT/sea.jpg
at_desk "get sea.jpg"
(cd $OUT && sha256sum -c sums >check) || fail "the photo is not what was saved"
note "$DESK $ smbclient //192.168.7.1/Photos -c 'get sea.jpg'"
note "sha256 $(sha256sum $OUT/sea.jpg | cut -c 1-32)...   $(cat $OUT/check)"
remember "the photo is what was saved, byte for byte" OK

kill $events $keeper
run remvol --del -n $TARGET
remvol --deinit >$OUT/log 2>&1 || :

say
say "${bold}Summary$plain"
cat $OUT/summary
say
say "  All of it ran for real: kernel, initiator, file system and Samba in an emulated machine"
say "  that ran $(seconds "$(clock)"), the storage server and the desk at the other ends of its cables."
