# timeout: 1500
# The operator's guide, word by word: every block of it is run, in its order, and so is every command of its sentences and tables,
# those of the README's table of calls, and the examples of manual pages that need a whole machine. What does not stand there as it
# stands here fails the scenario, and so does a command that stands there and not here.
GUIDE=/lab/operators-guide.md
README=/usr/share/doc/remvol/README.md

# block N: the text of the guide's Nth block.
block() { awk -v wanted="$1" '/^```/ { inside = !inside; number += inside; next } inside && number == wanted' $GUIDE; }

# What an operator puts in: names of the guide's own, and "yes" where apt asks.
as_operator() { sed -e "s/\b\(TARGET\|IQN\)\b/$IQN:t1/g" -e 's/\bNAME\b/Leftover/g' -e "s/\bsdb1\b/$partition/g"; }

# The documents' text outside of their blocks, without what a table's cells need.
sentences() { awk '/^```/ { inside = !inside; next } !inside' $GUIDE $README | sed 's/\\|/|/g'; }

# commands: what is a program with arguments in these sentences.
commands() {
    sentences | grep -o '`[^`]*`' | tr -d '`' | sort -u | while read -r program arguments; do
        [ -z "$arguments" ] || [ "${program#-}" != "$program" ] || ! command -v "$program" >/dev/null || echo "$program $arguments"
    done
}

# example PAGE: the lines of a manual page's examples.
example() {
    zcat -f /usr/share/man/man?/"$1"* | sed -n '/^\.SH EXAMPLES/,/^\.SH SEE/p' | sed -n '/^\.EX/,/^\.EE/p' |
        sed '/^\./d; s/\\-/-/g; s/\\e/\\/g'
}

# types TEXT: runs the commands of a block as a person's shell does, each of which must succeed.
types() {
    say "$1"
    printf '%s\n' "$1" >>/tmp/typed
    printf '%s\n' "$1" | as_operator >/tmp/commands
    sh -e /tmp/commands </dev/null >/tmp/commands.out 2>&1 || {
        status=$?
        cat /tmp/commands.out
        fail "the guide's commands gave status $status: $1"
    }
}

# does N BEGINNING: runs block N, which begins so.
does() {
    case $(block "$1") in "$2"*) ;; *) fail "block $1 of the guide begins otherwise than '$2'" ;; esac
    blocks_done="$blocks_done $1"
    types "$(block "$1")"
}

# text N BEGINNING: block N is no command.
text() {
    case $(block "$1") in "$2"*) ;; *) fail "block $1 of the guide begins otherwise than '$2'" ;; esac
    blocks_done="$blocks_done $1"
}

# stands COMMAND: it is a command of the sentences, and counts as run.
stands() {
    sentences | grep -F "\`$1" >/dev/null || fail "'$1' is not in the guide"
    echo "$1" >>/tmp/typed
}

# everyday COMMAND: runs a command of the sentences.
everyday() {
    stands "$1"
    types "$1"
}

# converse COMMAND [PROMPT ANSWER]...: runs a command at a terminal, where each prompt gets its answer when it is seen.
converse() {
    say "$1"
    rm -f /tmp/keyboard /tmp/terminal
    mkfifo /tmp/keyboard
    script -qefc "$(echo "$1" | as_operator)" /tmp/terminal </tmp/keyboard >/dev/null 2>&1 &
    conversation=$!
    exec 8>/tmp/keyboard
    while shift && [ $# -gt 0 ]; do
        wait_for 60 grep -aqF "$1" /tmp/terminal
        shift
        echo "$1" >&8
    done
    wait $conversation || fail "the command at the terminal gave status $?: $(cat /tmp/terminal)"
    exec 8>&-
}

# answers COMMAND [PROMPT ANSWER]...: "converse" with a command of the sentences.
answers() {
    stands "$1"
    converse "$@"
}

booted
target_start
remember target_add 1 $IQN:t1
remember lun_add 1 1 96M
# On the machine on which the packages were built their folder is below the sources.
mkdir -p /root/sources/build /root/sources/scripts
ln -s /lab/packages /root/sources/build/package
printf '#!/bin/sh\n' >/root/sources/scripts/package
chmod +x /root/sources/scripts/package
cd /root/sources
printf 'APT::Get::Assume-Yes "true";\nAPT::Sandbox::User "root";\n' >/etc/apt/apt.conf.d/operator

does 1 scripts/package
stands 'scripts/package --arch arm64' # takes a root of its own, and a network
booted
does 2 "systemctl status"
# What a machine does by hand that has no packages is done here already, and done once more.
everyday 'systemd-tmpfiles --create remvol.conf'
everyday '/usr/lib/remvol/initiator take'
everyday 'systemctl stop iscsid.socket iscsid.service'
everyday '/usr/lib/remvol/samba-include add'
everyday 'systemctl enable --now remvol remvol-notify.timer'
text 3 "# /etc/systemd/network/10-egiga0.link"
block 3 >/etc/systemd/network/10-egiga0.link
does 4 update-initramfs
everyday 'ktreec -S /var/run/ktree_sock_vv -g /iscsi/initiator/iqn'
expect_has "the initiator's name" -1b2c3d "$(cat /tmp/commands.out)"
does 5 "vv discover"
text 6 "# vvstat"
vvstat >/tmp/vvstat.out || fail "vvstat says $(cat /tmp/vvstat.out)"
expect_equal "vvstat's columns" "$(block 6 | sed -n 2p | xargs)" "$(sed -n 1p /tmp/vvstat.out | xargs)"
expect_equal "vvstat's volume" "Photos Running" "$(sed -n 2p /tmp/vvstat.out | awk '{ print $1, $2 }')"
expect_has "vvstat's verdict" "all 1 healthy, as of" "$(tail -n 1 /tmp/vvstat.out)"

text 7 "adduser --no-create-home"
converse "$(block 7 | sed -n 1p)" "Full Name" "" "Room Number" "" "Work Phone" "" "Home Phone" "" Other "" "correct?" Y
converse "$(block 7 | sed -n 2p)" "New SMB password:" secret "Retype new SMB password:" secret
as_client() { target_run timeout 60 smbclient //10.9.1.1/Photos -U "$1" -m SMB3 -c "$2" >/tmp/client.out 2>&1; }
echo "from a client" >/tmp/sent
expect "a client with a password writes" as_client maria%secret "put /tmp/sent sent"
expect_not "one without does" as_client nobody% "put /tmp/sent other"
text 8 "[Photos]"
groupadd family
block 8 >/etc/remvol/shares.conf
does 9 winshare_reload
expect "maria, who is in the list, reads" as_client maria%secret "get sent /tmp/got"
expect "what she has written" cmp /tmp/sent /tmp/got
text 10 "   force user"
sed -i "/^\[global\]/r /dev/stdin" /etc/samba/smb.conf <<END
$(block 10)
END
expect "smb.conf is good" testparm -s

text 11 "partition="
partition=$(disk_of $IQN:t1 1)1
sleep 100000 </mnt/VV/Photos/sent &
everyday 'fuser -kMm /mnt/VV/Photos'
wait $!
expect_equal "how the program ended that was in the folder" 137 $?
everyday 'systemctl stop remvol-keeper'
# A check of a file system wants a person.
block 11 | as_operator >/tmp/commands
converse "sh -e /tmp/commands"
expect "the volume is mounted again" mounted Photos
everyday 'systemctl start remvol-keeper'
stands 'e2fsck -b 32768' # of a disk whose beginning is lost
text 12 "MAILADDR admin"
block 12 >>/etc/remvol/remvol.conf
printf '#!/bin/sh\ncat >/var/lib/mail.$$\n' >/usr/sbin/sendmail
chmod +x /usr/sbin/sendmail
everyday 'remvol-events --test'
expect "the mail is sent" grep -qsx "To: admin@example.org" /var/lib/mail.*
does 13 "journalctl -x"

everyday 'vvstat Photos'
everyday 'vvstat -x'
everyday 'vvstat -x >/dev/null || alert'
everyday 'vvstat --json'
answers 'vvstat --watch' healthy q
everyday 'remvol --status'
everyday 'testparm -s'
everyday 'journalctl -u remvol-tree'
everyday 'journalctl -u remvol-events'
everyday 'systemctl restart remvol-events'
everyday 'iscsiadm -m session -P 3'
expect_has "the session's disk" "Attached scsi disk ${partition%1}" "$(cat /tmp/commands.out)"
everyday 'ls /sys/class/block/sdb1/holders'
stands 'grep sdb1 /proc/*/mountinfo' # some of these processes end meanwhile
expect_has "who uses the disk" " /mnt/VV/Photos " "$(grep "$partition" /proc/*/mountinfo 2>/dev/null)"

say "the manual pages' examples"
for page in remvol-events.8 remvol-keeper.8 remvol-notify.8 vvstat.1; do
    # What stays, and what this machine lacks, apart.
    example $page | grep -v -e '&$' -e '| jq ' >/tmp/example
    expect "$page has examples" [ -s /tmp/example ]
    while read -r line; do types "$line"; done </tmp/example
done
example ktree.8 >/tmp/example
types "$(sed 's/&$/\& sleep 2/; s/%1/$!/' /tmp/example)"
expect_has "the tree of one's own" share=Photos "$(cat /tmp/commands.out)"

everyday 'vv disconnect Photos'
expect_not "the volume is mounted" mounted Photos
target_chap 1 maria secret-of-12-
answers 'vv password Photos --user maria' "Password of maria:" secret-of-12-
everyday 'vv connect Photos'
everyday 'vv disconnect Photos'
tgtadm --lld iscsi --mode account --op unbind --tid 1 --user maria
everyday 'vv password Photos --no-password'
everyday 'vv rename-portal Photos --portal 10.9.1.2'
everyday 'vv connect Photos'
expect_equal "the portal" 10.9.1.2:3260 "$(vvstat -no PORTAL | xargs)"
everyday 'remvol -d 2'
everyday 'remvol -d 0'
everyday 'remvol --disconnect'
everyday 'remvol --status'
expect_not "the volume is mounted" mounted Photos
everyday 'systemctl restart remvol'
wait_for 60 mounted Photos
mkdir /mnt/VV/Leftover && chattr +i /mnt/VV/Leftover
everyday 'chattr -i /mnt/VV/NAME && rmdir /mnt/VV/NAME'
cp /etc/NAS_CFG/vv.xml /root/saved.xml
answers 'vv delete Photos' "[y/N]" y
everyday 'systemctl stop remvol'
expect_not "the volume is mounted" mounted Photos
cp /root/saved.xml /etc/NAS_CFG/vv.xml
everyday 'systemctl restart remvol-tree'
everyday 'systemctl start remvol'
wait_for 60 mounted Photos
expect_equal "what the client has written" "from a client" "$(cat /mnt/VV/Photos/sent)"

say "without units"
systemctl stop remvol remvol-tree remvol-general-tree remvol-notify.timer
everyday 'ktree -n config -s /var/run/ktree_sock &'
everyday '/usr/lib/remvol/modules'
everyday 'remvol --init'
everyday 'remvol-events &'
everyday 'remvol-keeper &'
types remvol-notify
expect "the volume is mounted" mounted Photos
pkill -x 'remvol-events|remvol-keeper'
everyday 'winshare_reload --withdraw'
everyday 'macshare_reload --withdraw'
everyday 'remvol --system_off'
expect_not "the volume is mounted" mounted Photos
everyday 'remvol --init'
everyday 'remvol --deinit'
pkill -x ktree
systemctl start remvol remvol-tree remvol-general-tree remvol-notify.timer
wait_for 60 mounted Photos

say "what destroys"
everyday 'ktreec -S /var/run/ktree_sock_vv -s /iscsi/initiator/id:1/lun/id:1/enable 1'
stands 'vv format Photos'
expect_not "a volume with files is formatted" vv format Photos
expect "the file is there" test -e /mnt/VV/Photos/sent
answers 'vv format Photos --destroy-data' "[y/N]" y
expect_not "the file is there" test -e /mnt/VV/Photos/sent
answers 'vv delete TARGET' "[y/N]" y
stands 'echo label: gpt | sfdisk /dev/sdX' # of a disk with somebody's data
# The README's calls, of which none asks.
for call in '--search -i 10.9.0.2 -p 3260' '--search_lun -n IQN -i 10.9.0.2 -p 3260 -c 0' \
    '--add -n IQN -l 1 -i 10.9.0.2 -p 3260 -s photos -c 0' '--connect -n IQN' '--format -n IQN -l 1' \
    '--disconnect -n IQN' '--del_lun -n IQN -l 1'; do
    everyday "remvol $call"
done
everyday 'remvol --add -n IQN -l 1 -i 10.9.0.2 -p 3260 -s photos -c 0'
everyday 'remvol --del -n IQN'

all=$(grep -c '^```' $GUIDE)
expect_equal "blocks of the guide that were run" "$(seq -s ' ' $((all / 2)))" "$(echo $blocks_done)"
commands >/tmp/commands
expect "there are commands" [ -s /tmp/commands ]
while read -r command; do grep -qF -e "$command" /tmp/typed || echo "$command"; done </tmp/commands >/tmp/untyped
expect_equal "commands that nobody has run" "" "$(cat /tmp/untyped)"
