# timeout: 3600
# The appliance's side of the proof by power cuts (power.py, replay.py): the targets, and what the runner asks for.
T=iqn.2026-01.org.example:t
LUN_DIR=/data/luns

# The LUNs outlive the power as a storage array's would. LUN 2 of target 2 belongs to somebody else: no command names it.
start_targets() {
    target_start
    target_add 1 ${T}1
    target_add 2 ${T}2
    for lun in "1 1" "1 2" "2 1"; do lun_add $lun 24M; done
    [ -e $LUN_DIR/t2-l2 ] || { yes "somebody else's" | head -c 2M >$LUN_DIR/t2-l2 && sync; }
    lun_add 2 2 2M
}

# keep SHARE FILE TEXT LINES: writes the text that often into the file, and returns when it is on the disk.
keep() { yes "$3" | head -n "$4" >"/mnt/VV/$1/$2" && sync "/mnt/VV/$1/$2" "/mnt/VV/$1"; }

# settings_files: the settings and their flash copy, one line each.
settings_files() {
    for file in /etc/NAS_CFG/vv.xml /usr/local/config/vv.xml; do
        if [ -e $file ]; then base64 -w0 $file; fi
        echo
    done
}

# report: what the appliance says and shows.
report() {
    ktreec -S "$TREE_SOCKET" -t /iscsi/initiator
    md5sum $LUN_DIR/t2-l2
    for folder in /mnt/VV/*; do
        [ -d "$folder" ] || continue
        grep -q " $(echo "$folder" | sed 's/ /\\\\040/g') " /proc/mounts && stat -f -c 'mount %i %n' "$folder"
        find "$folder" -type f -exec md5sum {} +
    done
}
