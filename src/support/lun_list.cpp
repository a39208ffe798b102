#include "support/lun_list.h"

#include <cstdlib>

namespace remvol {

LunNode* lun_node_new() {
  return static_cast<LunNode*>(calloc(1, sizeof(LunNode)));
}

void lun_node_free_list(LunNode* head) {
  while (head != nullptr) {
    LunNode* const next = head->next;
    free(head);
    head = next;
  }
}

void lun_node_append(LunNode* head, LunNode* node) {
  if (head == nullptr || node == nullptr) return;
  while (head->next != nullptr) head = head->next;
  head->next = node;
}

}  // namespace remvol
