#include <sys/socket.h>
#include <sys/un.h>

#include <csignal>
#include <cstdint>
#include <cstring>
#include <optional>

#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using Clock = std::chrono::steady_clock;

using DaemonTest = testsupport::LibraryTest;

// One connection per call: the length (with the zero, host byte order), text and zero, exact for
// frames under, at and over one write piece, and far over the socket buffer.
TEST_F(DaemonTest, EachCallIsOneConnectionWithOneExactFrame) {
  FakeDaemon daemon;
  std::vector<std::string> expected;
  for (const uint32_t size : {23U, 1023U, 1024U, 1025U, 5000U, 1U << 20}) {
    const std::string s(size - 23, 'x');  // {"data":"<s>","type":"t"} is 22 bytes more than s
    ASSERT_TRUE(SendCammandToDaemon("t", s)) << size;
    expected.push_back(std::string(reinterpret_cast<const char*>(&size), 4) + R"({"data":")" + s +
                       R"(","type":"t"})" + '\0');
  }
  EXPECT_TRUE(daemon.Connections(expected.size()) == expected);  // not printed: a MiB of x
}

TEST_F(DaemonTest, RefusesASocketPathThatLeavesNoRoomForTheTerminatingZero) {
  const size_t room = sizeof(sockaddr_un{}.sun_path);  // path bytes and terminating zero
  for (const size_t length : {room - 1, room}) {
    // A root of the chosen length inside the sandbox, with a daemon listening in it.
    const size_t padding = length - root_.size() - 1 - std::strlen(kDaemonSocketPath);
    if (padding > length) GTEST_SKIP() << "the sandbox root is too long for this test";
    const std::string root = At(std::string(padding, 'r'));
    std::filesystem::create_directories(root + "/var/run");
    ASSERT_TRUE(SetRootPrefix(root));
    ASSERT_EQ(DaemonSocketPath().size(), length);
    FakeDaemon daemon;
    EXPECT_EQ(SendCammandToDaemon("resume", Json::Value()), length < room) << length;
  }
}

// A stuck daemon fails the call within seconds, nobody listening at once and leaking nothing.
// SIGPIPE stays as the host process has it, and a closed connection does not raise it.
TEST_F(DaemonTest, AMissingOrStuckDaemonFailsTheCallWithinABound) {
  const std::string path = DaemonSocketPath();
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
  const int bound = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);  // bound, never listening
  const auto asFound = signal(SIGPIPE, SIG_DFL);
  using B = FakeDaemon::Behaviour;
  const std::tuple<const char*, std::optional<B>, double> cases[] = {
      {"closes unread", B::kAcceptAndClose, 10.0}, {"stops reading", B::kStopReading, 10.0},
      {"backlog full", B::kHoldConnect, 3.0},      {"no file", std::nullopt, 2.0},
      {"a regular file", std::nullopt, 2.0},       {"a bound socket", std::nullopt, 2.0}};
  for (const auto& [place, behaviour, seconds] : cases) {
    SCOPED_TRACE(place);
    const std::string what = place;
    unlink(path.c_str());
    if (what == "a regular file") WriteFile(path, "not a socket");
    ASSERT_TRUE(what != "a bound socket" ||
                bind(bound, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0);
    std::optional<FakeDaemon> daemon;
    if (behaviour) daemon.emplace(*behaviour);
    const int descriptors = testsupport::OpenDescriptorCount();
    const Clock::time_point start = Clock::now();
    EXPECT_FALSE(SendCammandToDaemon("t", std::string(1U << 20, 'x')));  // past the buffers
    EXPECT_LT(std::chrono::duration<double>(Clock::now() - start).count(),
              seconds);  // a bound, not a speed
    EXPECT_TRUE(behaviour || testsupport::OpenDescriptorCount() == descriptors);
    EXPECT_EQ(signal(SIGPIPE, SIG_DFL), SIG_DFL);
  }
  (void)signal(SIGPIPE, asFound);
  close(bound);
  EXPECT_TRUE(log.Lines().empty());  // the caller decides what a lost command means
}

}  // namespace
}  // namespace WEZO::FILEINDEX
