# What power.sh and disks.sh end with: brings up the targets, then runs one command line after the other as the runner sends
# them (machine.py), and answers each with "done STATUS" and what it printed.
start_targets
printf '\036up\n' >&9
while read -r line; do
    status=0
    eval "$line" >/tmp/answer 2>&1 </dev/null 9>&- || status=$?
    printf '\036done %d %s\n' "$status" "$(base64 -w0 /tmp/answer)" >&9
done <&9
