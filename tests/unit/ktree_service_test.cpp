// Frames and what the daemon answers to them.
#include "ktree/service.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstring>
#include <string>

#include "ktree/protocol.h"

namespace ktree {
namespace {

std::string frame(uint32_t length, uint8_t operation, uint8_t zero, uint16_t path_length,
                  const std::string& rest) {
  RequestHeader header = {length, operation, zero, path_length};
  std::string bytes(sizeof header, '\0');
  memcpy(bytes.data(), &header, sizeof header);
  return bytes + rest;
}

std::string request(Operation operation, const std::string& path, const std::string& value = "") {
  return frame(static_cast<uint32_t>(4 + path.size() + value.size()), static_cast<uint8_t>(operation), 0,
               static_cast<uint16_t>(path.size()), path + value);
}

std::string limit(uint32_t bytes) {
  return {reinterpret_cast<const char*>(&bytes), sizeof bytes};
}

class ServiceTest : public testing::Test {
 protected:
  ReplyStatus call(const std::string& bytes, int document = -1) {
    Request request = {};
    if (!parse_request(bytes, request)) {
      ADD_FAILURE() << "not a request";
      return ReplyStatus::kFailed;
    }
    request.document = document;
    const Service::Reply answer = service_.handle(request);
    body_ = answer.body;
    return answer.status;
  }
  ReplyStatus set(const std::string& path, const std::string& value) {
    return call(request(Operation::kSet, path, value));
  }
  ReplyStatus get(const std::string& path, uint32_t bytes = 65535) {
    return call(request(Operation::kGet, path, limit(bytes)));
  }

  Service service_;
  std::string body_;
};

TEST(Frame, SizeIsKnownFromFourBytes) {
  const std::string bytes = request(Operation::kGet, "/a", limit(1));
  EXPECT_EQ(request_size(bytes), bytes.size());
  EXPECT_EQ(request_size(bytes.substr(0, 4)), bytes.size());
  for (size_t size = 0; size < 4; size++) EXPECT_EQ(request_size(bytes.substr(0, size)), kMoreNeeded);
}

TEST(Frame, OfAnImpossibleSizeIsNone) {
  for (uint32_t length : {0U, 1U, 3U, 66563U, 70000U, 0x7FFFFFFFU, 0xFFFFFFFBU, 0xFFFFFFFCU, 0xFFFFFFFFU}) {
    EXPECT_EQ(request_size(frame(length, 1, 0, 0, "")), kNoRequest) << length;
  }
  EXPECT_EQ(request_size(frame(4, 1, 0, 0, "")), 8U);
  EXPECT_EQ(request_size(frame(66562, 1, 0, 0, "")), kMaxRequestBytes);
}

TEST(Frame, ThatDoesNotHoldTogetherIsNone) {
  Request request = {};
  EXPECT_FALSE(parse_request("", request));
  EXPECT_FALSE(parse_request("abcdefgh", request));
  EXPECT_FALSE(parse_request(frame(4, 0, 0, 0, ""), request));
  EXPECT_FALSE(parse_request(frame(4, 8, 0, 0, ""), request));
  EXPECT_FALSE(parse_request(frame(4, 255, 0, 0, ""), request));
  EXPECT_FALSE(parse_request(frame(4, 1, 1, 0, ""), request));
  EXPECT_FALSE(parse_request(frame(6, 1, 0, 3, "/a"), request));
  EXPECT_FALSE(parse_request(frame(6, 1, 0, 65535, "/a"), request));
  EXPECT_FALSE(parse_request(frame(7, 1, 0, 2, "/a"), request));
  EXPECT_FALSE(parse_request(frame(5, 1, 0, 2, "/a"), request));
  const std::string whole = frame(6, 1, 0, 2, "/a");
  EXPECT_TRUE(parse_request(whole, request));
  EXPECT_EQ(request.path, "/a");
  EXPECT_EQ(request.value, "");
}

TEST_F(ServiceTest, SetsAndGets) {
  EXPECT_EQ(get("/a"), ReplyStatus::kMissing);
  EXPECT_EQ(set("/a", "value"), ReplyStatus::kDone);
  EXPECT_EQ(get("/a"), ReplyStatus::kDone);
  EXPECT_EQ(body_, "value");
  EXPECT_EQ(get("/a", 3), ReplyStatus::kDone);
  EXPECT_EQ(body_, "val");
  EXPECT_EQ(get("/a", 0), ReplyStatus::kDone);
  EXPECT_EQ(body_, "");
}

TEST_F(ServiceTest, RefusesBadPathsAndChangesNothing) {
  EXPECT_EQ(set("/a/b:0", "x"), ReplyStatus::kRefused);
  EXPECT_EQ(get("/a"), ReplyStatus::kMissing);
  EXPECT_EQ(set("/", "x"), ReplyStatus::kRefused);
  EXPECT_EQ(set("", "x"), ReplyStatus::kRefused);
  EXPECT_EQ(get("/a:4097"), ReplyStatus::kRefused);
  EXPECT_EQ(call(request(Operation::kDel, "/")), ReplyStatus::kRefused);
}

TEST_F(ServiceTest, RefusesValuesThatATreeCannotHold) {
  EXPECT_EQ(set("/a", std::string("x\0y", 3)), ReplyStatus::kRefused);
  EXPECT_EQ(set("/a", std::string(65536, 'x')), ReplyStatus::kRefused);
  EXPECT_EQ(get("/a"), ReplyStatus::kMissing);
  EXPECT_EQ(set("/a", std::string(65535, 'x')), ReplyStatus::kDone);
}

TEST_F(ServiceTest, RefusesAGetWithoutItsLimit) {
  ASSERT_EQ(set("/a", "x"), ReplyStatus::kDone);
  EXPECT_EQ(call(request(Operation::kGet, "/a")), ReplyStatus::kRefused);
  EXPECT_EQ(call(request(Operation::kGet, "/a", "123")), ReplyStatus::kRefused);
}

TEST_F(ServiceTest, Deletes) {
  ASSERT_EQ(set("/a/b", "x"), ReplyStatus::kDone);
  EXPECT_EQ(call(request(Operation::kDel, "/a")), ReplyStatus::kDone);
  EXPECT_EQ(call(request(Operation::kDel, "/a")), ReplyStatus::kMissing);
  EXPECT_EQ(get("/a/b"), ReplyStatus::kMissing);
}

TEST_F(ServiceTest, DocumentsNeedAMemoryFile) {
  const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
  int pipes[2];
  ASSERT_EQ(pipe(pipes), 0);
  const int sealed = memfd_create("sealed", MFD_CLOEXEC | MFD_ALLOW_SEALING);
  ASSERT_EQ(fcntl(sealed, F_ADD_SEALS, F_SEAL_WRITE), 0);
  for (int document : {-1, null, pipes[1]}) {
    EXPECT_EQ(call(request(Operation::kDump, ""), document), ReplyStatus::kFailed);
    EXPECT_EQ(call(request(Operation::kLoad, ""), document), ReplyStatus::kFailed);
    EXPECT_EQ(call(request(Operation::kList, "/"), document), ReplyStatus::kFailed);
  }
  EXPECT_EQ(call(request(Operation::kDump, ""), sealed), ReplyStatus::kFailed);
  for (int fd : {null, pipes[0], pipes[1], sealed}) close(fd);
}

TEST_F(ServiceTest, LoadsWhatItDumped) {
  const int document = memfd_create("document", MFD_CLOEXEC);
  ASSERT_EQ(set("/a", "x"), ReplyStatus::kDone);
  ASSERT_EQ(call(request(Operation::kDump, ""), document), ReplyStatus::kDone);
  ASSERT_EQ(set("/a", "y"), ReplyStatus::kDone);
  ASSERT_EQ(set("/b", "z"), ReplyStatus::kDone);
  ASSERT_EQ(call(request(Operation::kLoad, ""), document), ReplyStatus::kDone);
  EXPECT_EQ(get("/a"), ReplyStatus::kDone);
  EXPECT_EQ(body_, "x");
  EXPECT_EQ(get("/b"), ReplyStatus::kMissing);
  close(document);
}

TEST_F(ServiceTest, ADamagedDocumentLeavesTheTreeAsItWas) {
  const int document = memfd_create("document", MFD_CLOEXEC);
  const std::string text = "<config>\n<a>new</a>\n<b>\n</config>";
  ASSERT_EQ(write(document, text.data(), text.size()), static_cast<ssize_t>(text.size()));
  ASSERT_EQ(set("/a", "old"), ReplyStatus::kDone);
  EXPECT_EQ(call(request(Operation::kLoad, ""), document), ReplyStatus::kDamaged);
  EXPECT_EQ(body_, "line 4: mismatched tag");
  EXPECT_EQ(get("/a"), ReplyStatus::kDone);
  EXPECT_EQ(body_, "old");
  close(document);
}

TEST_F(ServiceTest, ListsTheRootAndNodes) {
  const int document = memfd_create("document", MFD_CLOEXEC);
  ASSERT_EQ(set("/a", "x"), ReplyStatus::kDone);
  EXPECT_EQ(call(request(Operation::kList, "/"), document), ReplyStatus::kDone);
  EXPECT_EQ(call(request(Operation::kList, "/a:1"), document), ReplyStatus::kDone);
  EXPECT_EQ(call(request(Operation::kList, "/b"), document), ReplyStatus::kMissing);
  EXPECT_EQ(call(request(Operation::kList, ""), document), ReplyStatus::kRefused);
  char text[64] = "";
  EXPECT_EQ(pread(document, text, sizeof text, 0), 5);
  EXPECT_STREQ(text, "/a=x\n");
  close(document);
}

}  // namespace
}  // namespace ktree
