# timeout: 900
# after: installed
# The cable is out for 10 and for 60 seconds while a client of Samba writes: what heals by itself, and how fast. The client is
# on the other cable.
#
# What the project promises for its own part, from "the session is back" in the kernel to a volume that takes files: 10 seconds,
# and 10 more for the next target.

now() { cut -d' ' -f1 /proc/uptime; }
since() { awk "BEGIN { printf \"%.1f\", $(now) - $1 }"; }
later() { awk "BEGIN { printf \"%.1f\", $2 - $1 }"; }

useradd --no-create-home --shell /usr/sbin/nologin maria
printf 'secret\nsecret\n' | smbpasswd -s -a maria >/dev/null
as_client() { target_run timeout 20 smbclient "//10.9.1.1/$1" -U maria%secret -m SMB3 -c "$2"; }
head -c 1000 /dev/urandom >/tmp/sent

# A client that writes one file after the other, and notes which it could.
client() {
    number=0
    while :; do
        number=$((number + 1))
        if as_client Photos "put /tmp/sent file-$number" >/dev/null 2>&1; then echo "$(now) $number" >>/tmp/written; fi
        sleep 0.5
    done
}

takes_files() { timeout 20 sh -c "echo $$ >/mnt/VV/$1/test && sync /mnt/VV/$1/test" 2>/dev/null; }

# watch TARGET SHARE: notes when the session is back after the cut, and when its volume takes files again.
watch() {
    until session_is "$IQN:$1" LOGGED_IN; do sleep 0.1; done
    now >/tmp/back-$1
    until mounted "$2" && takes_files "$2"; do sleep 0.2; done
    now >/tmp/good-$1
}

# What the journal has of the recovery since the cable is back, in seconds behind that.
steps() {
    journalctl -b -o short-monotonic --no-pager -q | tr -d '[]' | awk -v from="$plugged" '
        $1 >= from && /session is back|re-mounted|Logout of|New iSCSI node|Attached SCSI disk|mounted filesystem|e2fsck 1/ {
            printf "    %6.1f", $1 - from
            $1 = $2 = ""
            print
        }'
}

# cut_for SECONDS: leaves what it took in healed_t1 and healed_t2.
cut_for() {
    say "cable out for $1 s"
    rm -f /tmp/back-* /tmp/good-*
    out=$(now)
    cable_cut 0
    while [ "$(awk "BEGIN { print ($(since "$out") < $1) }")" = 1 ]; do sleep 0.2; done
    plugged=$(now)
    cable_plug 0
    watch t1 Photos &
    watch t2 Music &
    wait_for 180 test -s /tmp/good-t1
    wait_for 180 test -s /tmp/good-t2
    for target in t1 t2; do
        read -r back </tmp/back-$target
        read -r good </tmp/good-$target
        say "  $target: session $(later "$plugged" "$back") s after the cable, its volume $(later "$back" "$good") s after the session"
        eval "healed_$target=$(later "$back" "$good")"
    done
    steps
    wait_for 60 vvstat
}

# healed_within FIRST SECOND: how many seconds behind their sessions the quicker and the slower target may be.
healed_within() {
    set -- $(printf '%s\n' "$healed_t1" "$healed_t2" | sort -n) "$@"
    within "the first volume takes files behind its session" "$1" "$3"
    within "the other one behind its session" "$2" "$4"
}

provokes_loss
client &
client=$!
wait_for 60 test -s /tmp/written
same() { stat -c %d:%i /mnt/VV/Photos/file; }
mount_before=$(same)
cut_for 10
expect_equal "the mount of before" "$mount_before" "$(same)"
cut_for 60
healed_within 10 20
before=$(tail -n 1 /tmp/written)
grew() { [ "$(tail -n 1 /tmp/written)" != "$before" ]; }
wait_for 60 grew
kill $client
say "the client wrote $(wc -l </tmp/written) files"
# Another name than before the cut: the last one that the client was told to be there.
last=$(tail -n 1 /tmp/written | cut -d' ' -f2)
expect "its last file is there and whole" cmp /tmp/sent /mnt/VV/Photos/file-$last
expect_equal "what was there before" "text of Photos" "$(cat /mnt/VV/Photos/file)"
booted
