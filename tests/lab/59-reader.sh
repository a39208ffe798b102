# What the administration pages see while volumes are made: 20 looks a second at the tree.
T=iqn.2026-01.org.example:t1
LUN_DIR=/data/luns
target_start
target_add 1 $T
lun_add 1 1 32M
lun_add 1 2 1G
works --init
works --add -n $T -l 1 -i 10.9.0.2 -p 3260 -s s1
works --connect -n $T
sed -i 's/^\[defaults\]/&\n\tlazy_itable_init = 0/' /etc/mke2fs.conf # a format that takes a while

# read_tree FILE: a line for every change, until the file "stop" exists.
read_tree() {
    last=
    until [ -e /tmp/stop ]; do
        ktreec -S $TREE_SOCKET -t >/tmp/tree
        now=
        while IFS= read -r line; do
            case $line in */id:1/lun/id:2/status=* | */id:1/lun/id:2/format_progress=* | */id:1/status=* | "$result_key="*)
                now="$now${line#/iscsi/initiator/}
" ;;
            esac
        done </tmp/tree
        if [ "$now" != "$last" ]; then printf '%s' "$now"; fi
        last=$now
        sleep 0.03
    done >"$1"
}

# watched OPTION...: runs a command that must succeed while the tree is read.
watched() {
    rm -f /tmp/stop
    result_key=/result/${1#--}
    tree_set "$result_key" "from before"
    read_tree /tmp/seen &
    reader=$!
    sleep 0.5
    works "$@"
    sleep 0.5
    : >/tmp/stop
    wait $reader
    grep "^$result_key=" /tmp/seen | uniq >/tmp/results
    expect_equal "the result of $1 over time" "from before,,0," "$(sed 's/.*=//' /tmp/results | tr '\n' ',')"
    progress_never_falls
    texts_are_whole
}

progress_never_falls() {
    highest=0
    for percent in $(sed -n 's|.*/format_progress=||p' /tmp/seen); do
        # The 100 of the format before gives way to 0 when the new one starts.
        if [ "$highest" = 100 ] && [ "$percent" = 0 ] && [ "$may_restart" = yes ]; then
            highest=0 may_restart=no
        fi
        [ "$percent" -ge "$highest" ] || fail "the progress fell from $highest to $percent"
        highest=$percent
    done
    expect_equal "progress at the end" 100 "$highest"
}

texts_are_whole() {
    sed -n 's|^id:1/status=||p' /tmp/seen | sort -u >/tmp/texts
    expect_equal "texts of the target" Connected "$(cat /tmp/texts)"
    sed -n 's|^id:1/lun/id:2/status=||p' /tmp/seen | sort -u >/tmp/texts
    while IFS= read -r text; do
        case $text in
        Offline | Running | "Creating Volume" | "Wait to Format" | "No Format") ;;
        Formatting\ [0-9]% | Formatting\ [0-9][0-9]% | "Formatting 100%") ;;
        *) fail "a text of the volume: '$text'" ;;
        esac
    done </tmp/texts
    expect_has "texts of the volume" "Formatting 0%" "$(cat /tmp/texts)"
    expect_has "texts of the volume" Running "$(cat /tmp/texts)"
}

may_restart=no
watched --add -n $T -l 2 -i 10.9.0.2 -p 3260 -s s2
expect "the volume is mounted" mounted s2
may_restart=yes
watched --format -n $T -l 2
expect "the volume is mounted" mounted s2
say "changes seen during the format: $(grep -c '/format_progress=' /tmp/seen)"
