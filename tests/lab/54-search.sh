# What a portal offers, with and without a result file, for targets in use and for others.
T=iqn.2026-01.org.example:
LISTS=/var/run/ktree_sock
value() { sed -n "s|^ *<$1>\(.*\)</$1>$|\1|p" "$2" | tr '\n' ' '; }
listed() { ktreec -S $LISTS -g "$1"; }

target_start
number=0
for name in pear apple fig lemon quince; do
    number=$((number + 1))
    target_add $number $T$name
done
lun_add 1 1 64M
lun_add 1 2 96M
lun_add 2 1 64M
works --init
works --add -n ${T}pear -l 1 -i 10.9.0.2 -p 3260 -s Pears
works --connect -n ${T}pear
echo text >/mnt/VV/Pears/file
general_tree_start
sorted="${T}apple ${T}fig ${T}lemon ${T}pear ${T}quince "

works --search -i 10.9.0.2 -p 3260 -o /tmp/target-list
expect_equal "targets in the file" "$sorted" "$(value name /tmp/target-list)"
expect_equal "the search is done" "1 " "$(value search_done /tmp/target-list)"
expect_not "its daemon is gone" test -e /var/run/ktree_sock_vv_search
expect_not "nothing went elsewhere" listed /temp/vv_search/search_done

works --search -i 10.9.0.2 -p 3260
found=
for n in 1 2 3 4 5; do found="$found$(listed /temp/vv_search/id:$n/name) "; done
expect_equal "targets in the tree" "$sorted" "$found"
expect_equal "the search is done" 1 "$(listed /temp/vv_search/search_done)"
works --search -i 10.9.1.2 -p 3260
expect_equal "they are found at the other port too" "${T}apple" "$(listed /temp/vv_search/id:1/name)"

# A target that nobody uses: logged in for the search alone.
works --search_lun -n ${T}apple -i 10.9.0.2 -p 3260 -c 0 -o /tmp/lun-list
expect_equal "LUNs" "1 " "$(value lun /tmp/lun-list)"
expect_equal "bytes" "67108864 " "$(value size /tmp/lun-list)"
expect_equal "free" "1 " "$(value avaliable /tmp/lun-list)"
expect_not "logged out again" logged_in ${T}apple
works --search_lun -n ${T}apple -i 10.9.0.2 -p 3260 -c 0
expect_equal "LUNs" 1 "$(listed /temp/vv_search_lun/lun/count)"
expect_has "the list for a person" "|-- LUN: 1 , Size : 67108864 bytes" "$(cat /tmp/remvol.out)"

# One that is in use goes on.
works --search_lun -n ${T}pear -i 10.9.0.2 -p 3260 -c 0 -o /tmp/lun-list
expect_equal "LUNs" "1 2 " "$(value lun /tmp/lun-list)"
expect_equal "bytes" "67108864 100663296 " "$(value size /tmp/lun-list)"
expect_equal "free" "0 1 " "$(value avaliable /tmp/lun-list)"
expect_equal "file systems" "ext4 unknown " "$(value fstype /tmp/lun-list)"
works --search_lun -n ${T}pear -i 10.9.0.2 -p 3260 -c 0
expect_equal "the first is in use" 0 "$(listed /temp/vv_search_lun/lun/id:1/avaliable)"
expect "it is still logged in" logged_in ${T}pear
expect_equal "and its volume there" text "$(cat /mnt/VV/Pears/file)"

# A target without LUNs, and one that does not exist.
works --search_lun -n ${T}fig -i 10.9.0.2 -p 3260 -c 0
expect_equal "LUNs" 0 "$(listed /temp/vv_search_lun/lun/count)"
expect_equal "error code" 0 "$(listed /temp/vv_search_lun/err_code)"
refuses --search_lun -n ${T}plum -i 10.9.0.2 -p 3260 -c 0
expect_equal "error code" 100 "$(listed /temp/vv_search_lun/err_code)"
expect_equal "only the target in use is logged in" 1 "$(iscsiadm -m session | wc -l)"
