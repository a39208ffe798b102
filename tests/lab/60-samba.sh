# needs: samba
# Volumes as Samba shares: a client on another machine writes and reads over the network, is refused what it may not
# do, and is put off when a volume goes. Samba is set up as the operator's guide says.
UMLAUTS="Grüße aus Köln"
generated=/run/remvol/smb-shares.conf

samba_prepare() {
    mkdir -p /etc/samba /var/lib/samba/private /var/cache/samba /var/log/samba /run/samba
    printf '[global]\n   load printers = no\n   disable spoolss = yes\n   map to guest = bad user\n' >/etc/samba/smb.conf
    printf '\n[global]\n   include = %s\n' $generated >>/etc/samba/smb.conf
    printf '%s\n' nobody:x:65534:65534::/:/bin/false maria:x:1000:1000::/:/bin/false otto:x:1001:1001::/:/bin/false >>/etc/passwd
    printf '%s\n' nogroup:x:65534: maria:x:1000: otto:x:1001: family:x:1002:otto >>/etc/group
    for name in maria otto; do printf 'secret\nsecret\n' | smbpasswd -s -a $name; done
}

samba_start() {
    smbd -D
    wait_for 20 smbcontrol smbd ping
}

samba_stop() {
    kill "$(cat /run/samba/smbd.pid)"
    wait_for 20 samba_is_gone
}

samba_is_gone() { ! pgrep -x smbd; }

smb() { target_run smbclient "//10.9.0.1/$1" -U "${user:-maria}%secret" -t 20; }

# client SHARE COMMANDS: what a client on the target's machine sees that does these in the share.
client() { echo "$2" | smb "$1" 2>&1; }

# expect_no_share SHARE: Samba does not offer it.
expect_no_share() { expect_has "share $1" NT_STATUS_BAD_NETWORK_NAME "$(client "$1" ls)"; }

# same FILE FILE: both hold the same text.
same() { [ "$(cat "$1")" = "$(cat "$2")" ]; }

# stay SHARE: a client connects and stays, has written a file, and reads its next commands from descriptor 4.
stay() {
    rm -f /tmp/commands
    mkfifo /tmp/commands
    smb "$1" </tmp/commands >/tmp/stayed 2>&1 &
    staying=$!
    exec 4>/tmp/commands
    echo "put /tmp/text before" >&4
    wait_for 20 same /tmp/text "/mnt/VV/$1/before"
}

# expect_put_off: the client that stays cannot write another file.
expect_put_off() {
    (trap '' PIPE && echo "put /tmp/text after" >&4) 2>/dev/null || : # it may have ended
    exec 4>&-
    wait $staying || :
    expect_has "what the client that stayed sees" NT_STATUS_ "$(cat /tmp/stayed)"
    expect_lacks "what it wrote" "putting file /tmp/text as \\after" "$(cat /tmp/stayed)"
    expect_equal "a file in a folder that is no volume" "" "$(find /mnt/VV -name after)"
}

samba_prepare
samba_start
echo "a text" >/tmp/text
target_start
for n in 1 2; do target_add $n $IQN:t$n && lun_add $n 1 64M; done
lun_add 1 2 64M
works --init
volume_add t1 1 Photos
volume_add t1 2 "$UMLAUTS"
volume_add t2 1 Archive
for n in 1 2; do works --connect -n $IQN:t$n; done

for share in Photos "$UMLAUTS" Archive; do
    seen=$(client "$share" 'put /tmp/text file
get file /tmp/back')
    expect "what '$share' stores: $seen" same /tmp/text "/mnt/VV/$share/file"
    expect "what '$share' gives" same /tmp/text /tmp/back
    rm /tmp/back
done
expect_has "a client without a password" NT_STATUS_ACCESS_DENIED \
    "$(target_run smbclient //10.9.0.1/Photos -N -c "put /tmp/text guest" 2>&1)"
expect_equal "the owner of the file" maria "$(stat -c %U /mnt/VV/Photos/file)"

# allow LIST: leaves Photos to these users and groups.
allow() {
    mkdir -p /etc/remvol
    printf '[photos]\nusers = %s\n' "$1" >/etc/remvol/shares.conf
    expect_equal "the reload" "" "$(winshare_reload 2>&1)"
}

# expect_barred USER SHARE, expect_welcome USER SHARE
expect_barred() { expect_has "$1 in $2" NT_STATUS_ACCESS_DENIED "$(user=$1 client "$2" ls)"; }
expect_welcome() { expect_has "$1 in $2" " file " "$(user=$1 client "$2" ls)"; }

# Who is not in the list of a share may not open it; the others are open to both. Who is in it meanwhile is put out.
for name in maria otto; do expect_welcome $name Photos; done
user=otto
stay Photos
user=
allow maria
expect_put_off
expect_welcome maria Photos
expect_barred otto Photos
expect_welcome otto Archive
allow "@family, nobody in particular"
expect_welcome otto Photos
expect_barred maria Photos
echo "[Photos]" >/etc/remvol/shares.conf
expect_has "a list that is none" "the shares stay as they are" "$(winshare_reload 2>&1)"
expect_barred maria Photos
rm /etc/remvol/shares.conf
winshare_reload
for name in maria otto; do expect_welcome $name Photos; done

# A reload that has nothing to do leaves the file alone.
before=$(stat -c '%i %y' $generated)
expect_equal "a reload without a change" "" "$(winshare_reload 2>&1)"
expect_equal "the generated file" "$before" "$(stat -c '%i %y' $generated)"

# The storage server protects a LUN: it can be read and not be written.
works --disconnect -n $IQN:t2
expect_no_share Archive
lun_delete 2 1
lun_add 2 1 64M readonly=1
works --connect -n $IQN:t2
seen=$(client Archive 'get file /tmp/back
put /tmp/text new
rm file')
expect "what can still be read: $seen" same /tmp/text /tmp/back
expect_has "a write" NT_STATUS_ACCESS_DENIED "$seen"
expect_equal "its files" file "$(cd /mnt/VV/Archive && echo [fn]*)"
expect_lacks "a write into another share" NT_STATUS_ "$(client Photos 'put /tmp/text new')"

# A volume that has gone without the tool: the client would go on and write into the folder that is left.
stay "$UMLAUTS"
umount -l "/mnt/VV/$UMLAUTS"
chmod 777 "/mnt/VV/$UMLAUTS"
expect_equal "the reload" "" "$(winshare_reload 2>&1)"
expect_put_off
expect_no_share "$UMLAUTS"
expect_lacks "another share" NT_STATUS_ "$(client Photos ls)"

# A volume that is deleted while a client is in it.
stay Photos
works --del_lun -n $IQN:t1 -l 1
expect_put_off
expect_no_share Photos
expect_lacks "another share" NT_STATUS_ "$(client Archive ls)"

# A name that would end its section: one line, and the others are served.
tree_set /iscsi/initiator/id:1/lun/id:1/share 'x] path=y'
mkdir '/mnt/VV/x] path=y'
mount "/dev/$(disk_of $IQN:t1 2)1" '/mnt/VV/x] path=y'
tree_set /iscsi/initiator/id:2/lun/id:1/vol_access_right 1
line=$(winshare_reload 2>&1)
expect_equal "the line" 'winshare_reload: volume "x] path=y" is not shared: it holds a character that the file server does not allow in names' "$line"
expect_lacks "another share" NT_STATUS_ "$(client Archive ls)"

# Without a server there is one line, and the server finds the shares when it starts.
samba_stop
tree_set /iscsi/initiator/id:2/lun/id:1/share Renamed
umount /mnt/VV/Archive
mkdir /mnt/VV/Renamed
mount -r "/dev/$(disk_of $IQN:t2 1)1" /mnt/VV/Renamed
tree_set /iscsi/initiator/id:1/lun/id:1/share None
status=0
line=$(winshare_reload 2>&1) || status=$?
expect_equal "the status" 0 $status
expect_equal "the line" "winshare_reload: Samba does not run; it finds the shares when it starts" "$line"
samba_start
expect_has "a share" " file " "$(client Renamed ls)"

# A target that is deleted takes its shares along.
works --del -n $IQN:t2
expect_no_share Renamed
