#include "sandbox.h"

#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "fileindex/root.h"

void SandboxTest::SetUp() {
  const char* tmp = std::getenv("TMPDIR");
  std::string pattern = std::string(tmp != nullptr && tmp[0] == '/' ? tmp : "/tmp") +
                        "/platform_test.XXXXXX";
  ASSERT_NE(mkdtemp(pattern.data()), nullptr);
  root_ = pattern;
  ASSERT_TRUE(WEZO::FILEINDEX::SetRootPrefix(root_));
}

void SandboxTest::TearDown() {
  WEZO::FILEINDEX::SetRootPrefix("");
  std::error_code ec;
  std::filesystem::remove_all(root_, ec);
}

void SandboxTest::Write(const std::string& relative, const std::string& text, mode_t mode) const {
  const std::filesystem::path path = At(relative);
  std::filesystem::create_directories(path.parent_path());
  std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
  ASSERT_EQ(chmod(path.c_str(), mode), 0);
}

std::string SandboxTest::Read(const std::string& relative) const {
  std::ifstream in(At(relative), std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}
