// The largest tree that the tool makes: 8 targets, 8 LUNs, every key of the layout, and the results and queue
// of a run.
#pragma once

#include <string>

template <typename Visit>
void for_each_entry_of_full_tree(Visit visit) {
  const std::string root = "/iscsi/initiator/";
  const std::pair<const char*, const char*> of_all[] = {
      {"iqn", "iqn.2004-04.com.example:appliance:iscsi.initiator.c0ffee"},
      {"prefix", "iqn.2004-04.com.example:appliance"},
      {"ver", "1"},
      {"dbg", "0"},
      {"count", "8"},
      {"total_lun_count", "8"},
  };
  const std::pair<const char*, const char*> of_target[] = {
      {"target", "iqn.2026-01.org.example:storage.disk-array-number"},
      {"ip", "fe80::5054:ff:fe12:3456"},
      {"port", "3260"},
      {"chap", "1"},
      {"chap_name", "appliance-user"},
      {"chap_pwd", "a secret of 16 by"},
      {"conn_set", "1"},
      {"conn_state", "1"},
      {"status", "Connected"},
      {"lun/count", "1"},
  };
  const std::pair<const char*, const char*> of_lun[] = {
      {"lun", "1"},
      {"share", "Photographs of the family"},
      {"enable", "1"},
      {"vol_access_right", "1"},
      {"format_state", "0"},
      {"format_progress", "100"},
      {"volume_state", "1"},
      {"status", "Ready"},
      {"size", "2199023255552/1099511627776"},
      {"fs_type", "ext4"},
      {"dev", "sdb"},
      {"mnt_dev", "/dev/sdb1"},
      {"mnt", "/mnt/VV/Photographs of the family"},
  };
  for (const auto& [key, value] : of_all) visit(root + key, std::string(value));
  for (int i = 1; i <= 8; i++) {
    const std::string target = root + "id:" + std::to_string(i) + "/";
    for (const auto& [key, value] : of_target) visit(target + key, std::string(value));
    for (const auto& [key, value] : of_lun) visit(target + "lun/id:1/" + key, std::string(value));
  }
  for (const char* command :
       {"init", "search", "add", "del", "format", "modify", "status", "connect", "disconnect"}) {
    visit(std::string("/result/") + command, std::string("0"));
  }
  for (int i = 1; i <= 8; i++) {
    visit("/temp/remvol/recover/queue/id:" + std::to_string(i) + "/target_name",
          std::string("iqn.2026-01.org.example:storage.disk-array-number"));
  }
  visit(std::string("/network_mgr/bonding/enable"), std::string("0"));
}
