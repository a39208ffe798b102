#include "vv/portal.h"

#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>

#include <algorithm>
#include <charconv>
#include <string_view>

namespace vv {
namespace {

constexpr int kLastPort = 65535;

struct PortalParts {
  std::string_view host, port;
};

// What stands before and behind the colon of the port. An address of IPv6 without brackets has none.
bool split(std::string_view text, PortalParts& parts) {
  const size_t bracket = text.rfind(']');
  const bool bracketed = text.starts_with('[') && bracket != std::string_view::npos;
  const bool bare = !bracketed && std::count(text.begin(), text.end(), ':') > 1;
  const size_t colon = bare ? std::string_view::npos : text.find(':', bracketed ? bracket : 0);
  const std::string_view host = text.substr(0, colon);
  if (bracketed && host.size() != bracket + 1) return false;
  parts.host = bracketed ? host.substr(1, bracket - 1) : host;
  parts.port = colon == std::string_view::npos ? std::string_view() : text.substr(colon + 1);
  return !parts.host.empty() && (colon == std::string_view::npos || !parts.port.empty());
}

bool read_port(std::string_view text, int& port) {
  if (text.empty()) return true;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), port);
  return error == std::errc() && end == text.data() + text.size() && port >= 1 && port <= kLastPort;
}

std::string numeric(const addrinfo& address) {
  char text[INET6_ADDRSTRLEN] = "";
  const void* bytes =
      address.ai_family == AF_INET6
          ? static_cast<const void*>(&reinterpret_cast<const sockaddr_in6*>(address.ai_addr)->sin6_addr)
          : &reinterpret_cast<const sockaddr_in*>(address.ai_addr)->sin_addr;
  return inet_ntop(address.ai_family, bytes, text, sizeof text) != nullptr ? text : "";
}

// The first one, as the tool takes it.
std::string resolve(const std::string& host, std::string& why) {
  addrinfo hints{};
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* found = nullptr;
  const int error = getaddrinfo(host.c_str(), nullptr, &hints, &found);
  if (error != 0) {
    why = host + ": " + gai_strerror(error);
    return {};
  }
  std::string address = numeric(*found);
  freeaddrinfo(found);
  return address;
}

}  // namespace

std::string Portal::stored_address() const {
  return address.find(':') != std::string::npos ? "[" + address + "]" : address;
}

std::string Portal::text() const {
  return stored_address() + ":" + std::to_string(port);
}

bool read_portal(const std::string& text, Portal& portal, std::string& why) {
  PortalParts parts;
  Portal read;
  if (!split(text, parts) || !read_port(parts.port, read.port)) {
    why = "\"" + text + "\" is no portal: an address such as 10.9.0.2, 10.9.0.2:3260 or [fd00::2]:3260 is";
    return false;
  }
  read.address = resolve(std::string(parts.host), why);
  if (!read.address.empty()) portal = read;
  return !read.address.empty();
}

Portal stored_portal(const std::string& address, int port) {
  const bool bracketed = address.size() > 2 && address.front() == '[' && address.back() == ']';
  return {bracketed ? address.substr(1, address.size() - 2) : address, port};
}

}  // namespace vv
