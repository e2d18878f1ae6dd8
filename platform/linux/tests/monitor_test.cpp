#include <unistd.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <string>

#include "json_io.h"
#include "sandbox.h"

namespace {

using WEZO::WEZOTIFYD::MonitorQueue;
using WEZO::WEZOTIFYD::QUEUE_TYPE_FILE;
using MonitorTest = SandboxTest;

MonitorQueue Entry(const std::string& queue, const std::string& dir) {
  Json::Value value;
  value["queue"] = queue;
  value["config"][0]["path"] = dir;
  value["config"][0]["mask"] = 65486;
  value["config"][0]["ignore"].append("@eaDir");
  return MonitorQueue(value);
}

TEST_F(MonitorTest, KeepsOneFilePerClientAndQueue) {
  const std::string queue = "/volume1/photo/@eaDir/q";
  const std::string file = At("var/lib/wezotifyd/fx/%2Fvolume1%2Fphoto%2F%40eaDir%2Fq.json");
  ASSERT_TRUE(MonitorQueue::Upsert(Entry(queue, "/volume1/photo/a"), "fx", QUEUE_TYPE_FILE));
  ASSERT_TRUE(MonitorQueue::Upsert(Entry(queue, "/volume1/photo/b"), "fx", QUEUE_TYPE_FILE));
  Json::Value stored;
  ASSERT_TRUE(WEZO::FILEINDEX::JsonFromFile(stored, file));
  EXPECT_EQ(stored, Entry(queue, "/volume1/photo/b").Entry());
  // A queue path cannot name a file outside the client's folder.
  ASSERT_TRUE(MonitorQueue::Upsert(Entry("../../x", "/d"), "fx", QUEUE_TYPE_FILE));
  EXPECT_EQ(access(At("var/lib/wezotifyd/fx/..%2F..%2Fx.json").c_str(), F_OK), 0);

  EXPECT_TRUE(MonitorQueue::Delete(queue, "fx", QUEUE_TYPE_FILE));
  EXPECT_NE(access(file.c_str(), F_OK), 0);
  EXPECT_TRUE(MonitorQueue::Delete(queue, "fx", QUEUE_TYPE_FILE) &&
              MonitorQueue::Delete(queue, "nobody", QUEUE_TYPE_FILE));
}

TEST_F(MonitorTest, RefusesWhatCannotBeARegistrationFile) {
  const std::pair<std::string, std::string> kCases[] = {// queue, client
                                                        {"/q", ""},
                                                        {"/q", "a/b"},
                                                        {"/q", ".."},
                                                        {"/q", std::string("a\0b", 3)},
                                                        {std::string(100, '/'), "c"}};
  for (const auto& [queue, client] : kCases) {
    SCOPED_TRACE(client);
    EXPECT_FALSE(MonitorQueue::Upsert(Entry(queue, "/d"), client, QUEUE_TYPE_FILE));
    EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
    EXPECT_FALSE(MonitorQueue::Delete(queue, client, QUEUE_TYPE_FILE));
  }
  Write("var/lib/wezotifyd", "not a folder");
  EXPECT_FALSE(MonitorQueue::Upsert(Entry("/q", "/d"), "fx", QUEUE_TYPE_FILE));
  EXPECT_NE(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
}

}  // namespace
