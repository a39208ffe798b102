# after: installed
# The root disk is full when the tree dies: it is there again as soon as there is room.
tree_answers() { tree_get /iscsi/initiator/count; }

# Later ones than Debian 12's systemd need no room to start it.
. /etc/os-release
[ "$VERSION_CODENAME" != bookworm ] || provokes 'No space left' 'Failed to start remvol-tree'
dd if=/dev/zero of=/fill bs=1M 2>/dev/null
dd if=/dev/zero of=/fill2 bs=1k 2>/dev/null
kill -KILL "$(cat /run/ktree_sock_vv_config.pid)"
sleep 25
rm /fill /fill2
wait_for 60 tree_answers
expect_active remvol-tree
expect_equal "its volumes" "Photos Music" "$(ktreec -S $TREE_SOCKET -t | sed -n 's/.*share=//p' | xargs)"
expect_equal "the file" "text of Photos" "$(cat /mnt/VV/Photos/file)"
