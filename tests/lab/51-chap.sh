# A target that asks for a secret.
T=iqn.2026-01.org.example:t1
target_start
target_add 1 $T
lun_add 1 1 64M
target_chap 1 user secret-of-12-
works --init

works --add -n $T -l 1 -i 10.9.0.2 -p 3260 -s a -c 1 -U user -P another-secret
refuses --connect -n $T
expect_equal "connect state" 4 "$(target_key 1 conn_state)"
expect_not "no session" logged_in $T
works --status
expect_equal "target" "Connect Error" "$(target_key 1 status)"

works --modify -n $T -c 1 -U user -P secret-of-12-
expect_not "it was not to be connected and is not" logged_in $T
works --connect -n $T
expect "the volume is mounted" mounted a
echo text >/mnt/VV/a/file

# Wrong again while it is connected: the settings are kept, the target is not.
works --modify -n $T -c 1 -U user -P another-secret
expect_equal "target" "Connect Error" "$(target_key 1 status)"
expect_equal "what is wished for at the next start" 0 "$(target_key 1 conn_set)"
expect_not "the volume is gone" mounted a
refuses --connect -n $T
works --modify -n $T -c 0
refuses --connect -n $T

works --modify -n $T -c 1 -U user -P secret-of-12-
works --connect -n $T
expect_equal "the file" text "$(cat /mnt/VV/a/file)"

# Right again while it is connected: it comes back by itself.
works --modify -n $T -c 1 -U user -P secret-of-12-
expect "the volume is mounted" mounted a
expect_equal "target" Connected "$(target_key 1 status)"
expect_equal "the settings are for root alone" 600 "$(stat -c %a /etc/NAS_CFG/vv.xml)"
