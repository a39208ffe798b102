# timeout: 900
# The operator's guide, word by word: every block of it is run, in its order, and so are the commands of its table of everyday
# work. What is not in the guide as it stands here fails the scenario.
GUIDE=/lab/operators-guide.md

# block N: the text of the guide's Nth block.
block() { awk -v wanted="$1" '/^```/ { inside = !inside; number += inside; next } inside && number == wanted' $GUIDE; }

# What an operator puts in: names of the guide's own, and "yes" where apt asks.
as_operator() { sed -e "s/\bTARGET\b/$IQN:t1/g" -e 's/\bNAME\b/Leftover/g'; }

# types TEXT: runs the commands of a block as a person's shell does, each of which must succeed.
types() {
    say "$1"
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

# everyday COMMAND: a command of the guide's tables and sentences.
everyday() {
    grep -Fq "\`$1" $GUIDE || fail "'$1' is not in the guide"
    types "$1"
}

# converse COMMAND [PROMPT ANSWER]...: runs a command at a terminal, where each prompt gets its answer when it is seen.
converse() {
    say "$1"
    rm -f /tmp/keyboard /tmp/terminal
    mkfifo /tmp/keyboard
    script -qefc "$1" /tmp/terminal </tmp/keyboard >/dev/null 2>&1 &
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
booted
does 2 "systemctl status"
text 3 "# /etc/systemd/network/10-egiga0.link"
block 3 >/etc/systemd/network/10-egiga0.link
does 4 update-initramfs
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
# A check of a file system wants a person.
block 11 | as_operator >/tmp/commands
converse "sh -e /tmp/commands"
expect "the volume is mounted again" mounted Photos
text 12 "MAILADDR admin"
block 12 >>/etc/remvol/remvol.conf
printf '#!/bin/sh\ncat >/var/lib/mail.$$\n' >/usr/sbin/sendmail
chmod +x /usr/sbin/sendmail
everyday 'remvol-events --test'
expect "the mail is sent" grep -qsx "To: admin@example.org" /var/lib/mail.*
does 13 "journalctl -x"

everyday 'vvstat Photos'
everyday 'vvstat -x'
everyday 'vvstat --json'
everyday 'remvol --status'
everyday 'vv disconnect Photos'
expect_not "the volume is mounted" mounted Photos
everyday 'vv rename-portal Photos --portal 10.9.1.2'
everyday 'vv connect Photos'
expect_equal "the portal" 10.9.1.2:3260 "$(vvstat -no PORTAL | xargs)"
everyday 'remvol -d 2'
everyday 'remvol -d 0'
mkdir /mnt/VV/Leftover && chattr +i /mnt/VV/Leftover
everyday 'chattr -i /mnt/VV/NAME && rmdir /mnt/VV/NAME'
cp /etc/NAS_CFG/vv.xml /root/saved.xml
everyday 'systemctl stop remvol'
expect_not "the volume is mounted" mounted Photos
cp /root/saved.xml /etc/NAS_CFG/vv.xml
everyday 'systemctl restart remvol-tree'
everyday 'systemctl start remvol'
wait_for 60 mounted Photos
expect_equal "what the client has written" "from a client" "$(cat /mnt/VV/Photos/sent)"

all=$(grep -c '^```' $GUIDE)
expect_equal "blocks of the guide that were run" "$(seq -s ' ' $((all / 2)))" "$(echo $blocks_done)"
