// A temporary root prefix per test, and small file helpers over it.
#ifndef WEZO_PLATFORM_LINUX_TESTS_SANDBOX_H_
#define WEZO_PLATFORM_LINUX_TESTS_SANDBOX_H_

#include <gtest/gtest.h>
#include <sys/types.h>

#include <string>

class SandboxTest : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  // The absolute path of `relative` under the sandbox root.
  std::string At(const std::string& relative) const { return root_ + "/" + relative; }
  // Writes `text` to `relative`, creating its folders, with `mode`.
  void Write(const std::string& relative, const std::string& text, mode_t mode = 0644) const;
  std::string Read(const std::string& relative) const;
  void WriteSmbConf(const std::string& text) const { Write("etc/samba/smb.conf", text); }

  std::string root_;
};

#endif  // WEZO_PLATFORM_LINUX_TESTS_SANDBOX_H_
