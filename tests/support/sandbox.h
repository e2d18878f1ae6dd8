// A canonical temporary directory per test as the library's root prefix, set in the constructor
// so that derived fixtures run inside it, with small file helpers.
#ifndef FILEINDEX_TESTS_SUPPORT_SANDBOX_H_
#define FILEINDEX_TESTS_SUPPORT_SANDBOX_H_

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
  SandboxTest() {
    const char* tmp = std::getenv("TMPDIR");
    std::string dir = std::string(tmp != nullptr && tmp[0] == '/' ? tmp : "/tmp") + "/fit.XXXXXX";
    if (mkdtemp(dir.data()) == nullptr) {
      ADD_FAILURE() << "mkdtemp failed in " << dir;
      return;
    }
    root_ = std::filesystem::canonical(dir).string();
    EXPECT_TRUE(WEZO::FILEINDEX::SetRootPrefix(root_));
  }
  ~SandboxTest() override {
    WEZO::FILEINDEX::SetRootPrefix("");
    std::error_code ec;
    if (!root_.empty()) std::filesystem::remove_all(root_, ec);
  }

  // `relative` ("var/run/x", or "/var/run/x") inside the sandbox.
  std::string At(const std::string& relative) const {
    return root_ + (relative.empty() || relative[0] != '/' ? "/" : "") + relative;
  }
  // Writes `text` to `relative` with `mode`, creating its folders.
  void Write(const std::string& relative, const std::string& text, mode_t mode = 0644) const {
    std::filesystem::create_directories(std::filesystem::path(At(relative)).parent_path());
    std::ofstream(At(relative), std::ios::binary | std::ios::trunc) << text;
    ASSERT_EQ(chmod(At(relative).c_str(), mode), 0) << relative;
  }
  // The file's content ("" when it cannot be read).
  std::string Read(const std::string& relative) const {
    std::ostringstream text;
    text << std::ifstream(At(relative), std::ios::binary).rdbuf();
    return text.str();
  }

  std::string root_;
};

#endif  // FILEINDEX_TESTS_SUPPORT_SANDBOX_H_
