// A temporary root prefix per test, and small file helpers over it.
#ifndef WEZO_PLATFORM_LINUX_TESTS_SANDBOX_H_
#define WEZO_PLATFORM_LINUX_TESTS_SANDBOX_H_

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "fileindex/root.h"

class SandboxTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const char* tmp = std::getenv("TMPDIR");
    std::string dir = std::string(tmp != nullptr && tmp[0] == '/' ? tmp : "/tmp") + "/plt.XXXXXX";
    ASSERT_NE(mkdtemp(dir.data()), nullptr);
    root_ = dir;
    ASSERT_TRUE(WEZO::FILEINDEX::SetRootPrefix(root_));
  }
  void TearDown() override {
    WEZO::FILEINDEX::SetRootPrefix("");
    std::error_code ec;
    std::filesystem::remove_all(root_, ec);
  }

  std::string At(const std::string& relative) const { return root_ + "/" + relative; }
  // Writes `text` to `relative` with `mode`, creating its folders.
  void Write(const std::string& relative, const std::string& text, mode_t mode = 0644) const {
    std::filesystem::create_directories(std::filesystem::path(At(relative)).parent_path());
    std::ofstream(At(relative), std::ios::binary | std::ios::trunc) << text;
    ASSERT_EQ(chmod(At(relative).c_str(), mode), 0);
  }
  std::string Read(const std::string& relative) const {
    std::ostringstream text;
    text << std::ifstream(At(relative), std::ios::binary).rdbuf();
    return text.str();
  }

  std::string root_;
};

#endif  // WEZO_PLATFORM_LINUX_TESTS_SANDBOX_H_
