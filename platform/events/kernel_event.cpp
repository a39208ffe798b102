#include "events/kernel_event.h"

#include <linux/netlink.h>

#include <cstddef>
#include <cstring>

namespace events {
namespace {

// The part of struct iscsi_uevent of the kernel's include/scsi/iscsi_if.h that arrives here; that header is
// not among those for programs. The layout is the interface to iscsid and has kept its size since 2005.
struct UserEvent {
  uint32_t type;
  uint32_t interface_error;
  uint64_t transport_handle;
  uint64_t from_user[3];
  struct {
    uint32_t session;
    uint32_t connection;
    uint64_t handle_or_error;
  } from_kernel;
};
static_assert(offsetof(UserEvent, from_kernel) == 40 && sizeof(UserEvent) == 56);

constexpr uint32_t kReceivedPdu = 101;
constexpr uint32_t kConnectionError = 102;

// The head of a login response, RFC 7143 section 11.13.
struct LoginResponse {
  uint8_t opcode;
  uint8_t flags;
  uint8_t between[34];
  uint8_t status_class;
  uint8_t status_detail;
  uint8_t rest[10];
};
static_assert(offsetof(LoginResponse, status_class) == 36 && sizeof(LoginResponse) == 48);

constexpr uint8_t kOpcodeMask = 0x3f;
constexpr uint8_t kLoginResponse = 0x23;
constexpr uint8_t kTransitToFullFeature = 0x83;  // the T bit and the full feature phase as the next stage

bool accepts_login(const unsigned char* pdu, size_t size) {
  LoginResponse response;
  if (size < sizeof response) return false;
  memcpy(&response, pdu, sizeof response);
  return (response.opcode & kOpcodeMask) == kLoginResponse && response.status_class == 0 &&
         (response.flags & kTransitToFullFeature) == kTransitToFullFeature;
}

KernelEvent read_event(const unsigned char* data, size_t size) {
  UserEvent received;
  if (size < sizeof received) return {KernelEventKind::kOther, 0};
  memcpy(&received, data, sizeof received);
  const uint32_t session = received.from_kernel.session;
  if (received.type == kConnectionError) return {KernelEventKind::kConnectionLost, session};
  const bool accepted =
      received.type == kReceivedPdu && accepts_login(data + sizeof received, size - sizeof received);
  return {accepted ? KernelEventKind::kLoggedIn : KernelEventKind::kOther, session};
}

}  // namespace

bool take_kernel_event(const unsigned char*& data, size_t& size, KernelEvent& event) {
  nlmsghdr header;
  if (size < sizeof header) return false;
  memcpy(&header, data, sizeof header);
  if (header.nlmsg_len < sizeof header || header.nlmsg_len > size) return false;
  event = read_event(data + NLMSG_HDRLEN, header.nlmsg_len - static_cast<uint32_t>(NLMSG_HDRLEN));
  const size_t whole = NLMSG_ALIGN(static_cast<size_t>(header.nlmsg_len));
  const size_t taken = whole < size ? whole : size;
  data += taken;
  size -= taken;
  return true;
}

}  // namespace events
