# after: installed
# Searches work on a machine with nothing prepared: their results go to the general tree, which has a unit of its own.
LISTS=/var/run/ktree_sock
listed() { ktreec -S $LISTS -g "$1"; }

works --search -i 10.9.0.2 -p 3260
expect_equal "the first target" $IQN:t1 "$(listed /temp/vv_search/id:1/name)"
expect_equal "the second target" $IQN:t2 "$(listed /temp/vv_search/id:2/name)"
expect_equal "the search is done" 1 "$(listed /temp/vv_search/search_done)"
works --search_lun -n $IQN:t1 -i 10.9.0.2 -p 3260 -c 0
expect_equal "LUNs" 1 "$(listed /temp/vv_search_lun/lun/count)"

# It comes back when it dies, and a restart of the volumes leaves it alone.
general=$(cat /run/ktree_sock_config.pid)
kill -KILL "$general"
answers() { ktreec -S $LISTS -s /temp/x 1; }
wait_for 40 answers
general=$(cat /run/ktree_sock_config.pid)
systemctl restart remvol
expect_equal "the general tree after a restart of the volumes" "$general" "$(cat /run/ktree_sock_config.pid)"
expect_active remvol-general-tree
