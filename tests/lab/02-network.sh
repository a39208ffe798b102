# timeout: 150
# The lab itself: cables, packets and addresses between the appliance and the target.
reaches() { ping -c 1 -W 1 "$1"; }
loses() { ! reaches "$1"; }
has_carrier() { [ "$(cat "/sys/class/net/$1/carrier")" = "$2" ]; }

for address in 10.9.0.2 10.9.1.2 fd00:9:0::2 fd00:9:1::2 fe80::2%egiga0 fe80::12%egiga1; do
    wait_for 10 reaches $address
done
expect "cut the cable" cable_cut 0
wait_for 5 has_carrier egiga0 0
wait_for 5 loses 10.9.0.2
wait_for 10 reaches 10.9.1.2
expect "put the cable back" cable_plug 0
wait_for 10 has_carrier egiga0 1
for address in 10.9.0.2 fd00:9:0::2 fe80::2%egiga0; do
    wait_for 10 reaches $address
done

expect "drop every packet" packets_drop 1 100
expect_not "no packet comes through" reaches 10.9.1.2
expect "the carrier stays" has_carrier egiga1 1
expect "let them pass again" packets_pass 1
wait_for 5 reaches 10.9.1.2

expect "give the portal another address" portal_move 0 10.9.0.2/24 10.9.0.7/24
wait_for 5 reaches 10.9.0.7
wait_for 5 loses 10.9.0.2
