# timeout: 900
# after: installed
# The cable is out for 10 and for 60 seconds while a client of Samba writes: what heals by itself, and how fast. The client is
# on the other cable.
#
# What the project promises for its own part, from "the session is back" in the kernel to a volume that takes files, is 10 seconds,
# and 10 more for the next target. 8 of these are waits that are settled, and some 4 more go here to the start of programs: judged
# are 15 seconds and 15 more.

now() { cut -d' ' -f1 /proc/uptime; }
since() { awk "BEGIN { printf \"%.1f\", $(now) - $1 }"; }
later() { awk "BEGIN { printf \"%.1f\", $2 - $1 }"; }

useradd --no-create-home --shell /usr/sbin/nologin maria
printf 'secret\nsecret\n' | smbpasswd -s -a maria >/dev/null
head -c 1000 /dev/urandom >/tmp/sent

# What is measured has one processor, on which the start of a program takes some 20 ms: whatever asks and writes beside it is one
# program each.

# A client that writes ten files, one after the other, over a connection, and then over another one.
client() {
    until [ -e /tmp/enough ]; do
        for _ in 1 2 3 4 5 6 7 8 9 10; do
            read -r uptime _ </proc/uptime
            echo "put /tmp/sent file-$uptime" && sleep 0.5
        done | target_run stdbuf -oL smbclient //10.9.1.1/Photos -U maria%secret -m SMB3 -t 20 >>/tmp/client 2>&1
    done
}

# The files that the client was told to be there.
written() { sed -n 's/^putting file .* as [\\]\(file-[0-9.]*\) .*/\1/p' /tmp/client; }

# watch TARGET SHARE: notes when the session is back after the cut, and when its volume takes files again.
watch() {
    perl -MIO::Handle -MPOSIX=_exit -e '
        my ($name, $target, $folder) = @ARGV;
        sub pause { select undef, undef, undef, 0.1 }
        sub lines { open my $file, "<", $_[0] or return; map { chomp; $_ } <$file> }
        sub note { open my $file, ">", "/tmp/$_[0]-$name.new"; print $file +(split " ", (lines "/proc/uptime")[0])[0];
                   close $file; rename "/tmp/$_[0]-$name.new", "/tmp/$_[0]-$name" }
        sub back { grep { (lines "$_/targetname")[0] eq $target && (lines "$_/state")[0] eq "LOGGED_IN" }
                   glob "/sys/class/iscsi_session/session*" }
        sub mounted { grep { (split)[1] eq $folder } lines "/proc/self/mounts" }
        sub takes_files {  # tried by a process that may be ended as a user of the volume
            my $try = fork // die;
            if (!$try) {
                alarm 20;
                my $file;
                _exit !(open $file, ">", "$folder/test" and print $file "$$\n" and $file->flush and $file->sync);
            }
            waitpid $try, 0;
            return $? == 0;
        }
        pause until back;
        note "back";
        pause until mounted && takes_files;
        note "good";
    ' "$1" "$IQN:$1" "/mnt/VV/$2"
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
has_written() { [ -n "$(written)" ]; }
wait_for 60 has_written
same() { stat -c %d:%i /mnt/VV/Photos/file; }
mount_before=$(same)
cut_for 10
expect_equal "the mount of before" "$mount_before" "$(same)"
cut_for 60
before=$(written | tail -n 1)
grew() { [ "$(written | tail -n 1)" != "$before" ]; }
wait_for 60 grew
touch /tmp/enough
wait $client
healed_within 15 30
say "the client wrote $(written | wc -l) files"
expect "its last file is there and whole" cmp /tmp/sent "/mnt/VV/Photos/$(written | tail -n 1)"
expect_equal "what was there before" "text of Photos" "$(cat /mnt/VV/Photos/file)"
booted
