#include <unistd.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <string>

#include "json_io.h"
#include "sandbox.h"

namespace {

using WEZO::WEZOTIFYD::MonitorQueue;
using WEZO::WEZOTIFYD::QUEUE_TYPE_FILE;

class MonitorTest : public SandboxTest {
 protected:
  static MonitorQueue Entry(const std::string& queue, const std::string& dir) {
    Json::Value value;
    value["queue"] = queue;
    Json::Value config;
    config["path"] = dir;
    config["mask"] = 65486;
    config["ignore"].append("@eaDir");
    value["config"].append(config);
    return MonitorQueue(value);
  }
  std::string Registration(const std::string& client, const std::string& encoded) const {
    return At("var/lib/wezotifyd/" + client + "/" + encoded + ".json");
  }
};

TEST_F(MonitorTest, KeepsOneFilePerClientAndQueue) {
  const std::string queue = "/volume1/photo/@eaDir/WEZO@file_index_queue";
  const std::string file = Registration("fileindex", "%2Fvolume1%2Fphoto%2F%40eaDir%2FWEZO%40file_index_queue");
  ASSERT_TRUE(MonitorQueue::Upsert(Entry(queue, "/volume1/photo/a"), "fileindex", QUEUE_TYPE_FILE));
  ASSERT_TRUE(MonitorQueue::Upsert(Entry(queue, "/volume1/photo/b"), "fileindex", QUEUE_TYPE_FILE));
  Json::Value stored;
  ASSERT_TRUE(WEZO::FILEINDEX::JsonFromFile(stored, file));
  EXPECT_EQ(stored, Entry(queue, "/volume1/photo/b").Entry());

  // A queue path cannot name a file outside the client's folder.
  ASSERT_TRUE(MonitorQueue::Upsert(Entry("../../x", "/d"), "fileindex", QUEUE_TYPE_FILE));
  EXPECT_EQ(access(Registration("fileindex", "..%2F..%2Fx").c_str(), F_OK), 0);

  EXPECT_TRUE(MonitorQueue::Delete(queue, "fileindex", QUEUE_TYPE_FILE));
  EXPECT_NE(access(file.c_str(), F_OK), 0);
  EXPECT_TRUE(MonitorQueue::Delete(queue, "fileindex", QUEUE_TYPE_FILE));
  EXPECT_TRUE(MonitorQueue::Delete(queue, "nobody", QUEUE_TYPE_FILE));
}

TEST_F(MonitorTest, RefusesNamesThatCannotBeAFile) {
  const std::string tooLong(100, '/');
  const struct {
    std::string queue;
    std::string client;
  } cases[] = {
      {"/q", ""}, {"/q", "a/b"}, {"/q", ".."}, {"/q", std::string("a\0b", 3)}, {tooLong, "c"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.client);
    EXPECT_FALSE(MonitorQueue::Upsert(Entry(c.queue, "/d"), c.client, QUEUE_TYPE_FILE));
    EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
    EXPECT_FALSE(MonitorQueue::Delete(c.queue, c.client, QUEUE_TYPE_FILE));
  }
  EXPECT_NE(access(At("var/lib/wezotifyd/a").c_str(), F_OK), 0);
}

TEST_F(MonitorTest, AnUnwritableRegistryIsAFailure) {
  Write("var/lib/wezotifyd", "not a folder");
  EXPECT_FALSE(MonitorQueue::Upsert(Entry("/q", "/d"), "fileindex", QUEUE_TYPE_FILE));
  EXPECT_NE(WLIBCErrGet(), 0);
}

}  // namespace
