# What the administration pages see while volumes are made: some 20 looks a second at the tree.
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

# read_tree FILE: the whole tree over and over until the file "stop" exists. A look takes as long as the emulated processor
# needs to start a program, so there is no pause, and what was seen is made out afterwards.
read_tree() {
    until [ -e /tmp/stop ]; do
        ktreec -S $TREE_SOCKET -t
        echo "end of look"
    done >"$1"
}

# changes FILE: of the looks, a line for every change of what the pages show.
changes() {
    awk -v result="$result_key=" '
        /^end of look$/ { if (now != last) printf "%s", now; last = now; now = ""; next }
        /\/id:1\/lun\/id:2\/(status|format_progress)=/ || /\/id:1\/status=/ || index($0, result) == 1 {
            sub("^/iscsi/initiator/", ""); now = now $0 "\n"
        }' "$1"
}

# watched OPTION...: runs a command that must succeed while the tree is read.
watched() {
    rm -f /tmp/stop
    result_key=/result/${1#--}
    tree_set "$result_key" "from before"
    read_tree /tmp/looks &
    reader=$!
    sleep 0.5
    began=$(uptime_seconds)
    works "$@"
    took=$(($(uptime_seconds) - began))
    sleep 0.5
    : >/tmp/stop
    wait $reader
    changes /tmp/looks >/tmp/seen
    say "$1: $(grep -c '^end of look$' /tmp/looks) looks in $took seconds"
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
