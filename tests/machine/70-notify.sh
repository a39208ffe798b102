# after: installed
# timeout: 900
# News under the machine's own units: the listener's loss and return, the timer's look, mail, the program and the folder, the
# journal with its catalog, metrics. Then the commands of the documents that need a whole machine.
NEWS=/var/lib/news

# told FILE LINE: the file of news has the line.
told() { grep -qsx "$2" "$NEWS/$1"; }

# mailed EVENT SHARE: a mail says so.
mailed() {
    for mail in $(grep -lsx "Subject: $1 on $(hostname)" $NEWS/mail.*); do
        grep -q "^Volume $2: " "$mail" && return 0
    done
    return 1
}

provokes_loss
mkdir -p $NEWS /etc/remvol/events.d
printf '#!/bin/sh\ncat >%s/mail.$$\n' $NEWS >/usr/sbin/sendmail
printf '#!/bin/sh\necho "$@" >>%s/program\n' $NEWS >/usr/local/sbin/volume-news
printf '#!/bin/sh\necho "$REMVOL_EVENT $REMVOL_SHARE" >>%s/folder\n' $NEWS >/etc/remvol/events.d/10-news
chmod 755 /usr/sbin/sendmail /usr/local/sbin/volume-news /etc/remvol/events.d/10-news
printf 'MAILADDR admin@example.org\nPROGRAM  /usr/local/sbin/volume-news\n' >/etc/remvol/remvol.conf

remvol-events --test
expect "the program is told of a test" told program "test  "
expect "the folder is told of a test" told folder "test "
expect_equal "a mail of the test" 1 "$(grep -lx "To: admin@example.org" $NEWS/mail.* | wc -l)"
expect_active remvol-notify.timer

say "the cable is cut and put back"
cable_cut 0
for share in Photos Music; do
    wait_for 60 mailed lost $share
    wait_for 20 told folder "lost $share"
done
expect "the program is told" told program "lost $IQN:t1 Photos"
expect_has "since when" " (since " "$(vvstat)"
expect_has "the journal's entry" "the connection was lost" "$(journalctl -b --no-pager -o cat EVENT=lost SHARE=Photos PRIORITY=3)"
expect_has "its explanation" "-- Subject: " "$(journalctl --no-pager -x SYSLOG_IDENTIFIER=remvol-notify SHARE=Photos)"
expect_has "all of them" "$IQN:t2" "$(journalctl --no-pager -x -o verbose SYSLOG_IDENTIFIER=remvol-notify)"
cable_plug 0
wait_for 120 vvstat -x
for share in Photos Music; do wait_for 240 mailed back $share; done
expect_equal "losses told" 2 "$(grep -c '^lost ' $NEWS/folder)"

say "what no connection tells of is found by the timer"
mount -o remount,ro /mnt/VV/Music
wait_for 180 mailed read-only Music
mount -o remount,rw /mnt/VV/Music

say "metrics"
mkdir -p /var/lib/prometheus/node-exporter
systemctl enable --now remvol-metrics.timer
# What the unit sees of the volumes is what everybody sees: none is read-only because the unit may not write.
has_metrics() { grep -q '^remvol_volume_seconds_since_change{share="Photos"' /var/lib/prometheus/node-exporter/remvol.prom; }
wait_for 120 has_metrics
expect "a volume that is well is so in the metrics" \
    grep -q '^remvol_volume_healthy{share="Photos".* 1$' /var/lib/prometheus/node-exporter/remvol.prom

say "what the documents tell an operator to do"
expect_has "the units" remvol-keeper.service "$(systemctl status 'remvol*')"
expect_has "their messages" remvol-events "$(journalctl --no-pager -u 'remvol*')"
journalctl --no-pager -t winshare_reload
expect_has "the listener" "the connection is lost" "$(journalctl --no-pager -b -u remvol-events)"
journalctl --no-pager -b -u remvol-keeper
printf '\n\n\n\n\ny\n' | adduser --no-create-home --disabled-login maria >/dev/null
printf 'secret\nsecret\n' | smbpasswd -s -a maria
printf '[Photos]\nusers = maria, @family\n' >/etc/remvol/shares.conf
winshare_reload; macshare_reload
expect_has "who may open the share" "valid users = maria @family" "$(testparm -s 2>/dev/null)"
cp -p /etc/NAS_CFG/vv.xml /root/vv.xml
works --del -n $IQN:t2
systemctl stop remvol
cp -p /root/vv.xml /etc/NAS_CFG/vv.xml
systemctl restart remvol-tree
systemctl start remvol
wait_for 60 vvstat Music
expect_equal "a file of the volume that is back" "text of Music" "$(cat /mnt/VV/Music/file)"
printf '[Match]\nMACAddress=00:90:a9:1b:2c:3d\n\n[Link]\nName=egiga0\n' >/etc/systemd/network/10-egiga0.link
update-initramfs -u
expect_has "the early system" 10-egiga0.link "$(lsinitramfs "/boot/initrd.img-$(uname -r)")"
