// This build, installed once per test program into a folder of its own.
#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "tests/package/shell.h"
#include "tests/support/temp_folder.h"

namespace vemo::test {

class InstalledPackage : public testing::Test {
 protected:
  static void SetUpTestSuite() {
    if (IsSanitized()) return;
    s_folder = std::make_unique<TempFolder>();
    const CommandResult installed = RunCommand(std::string(VEMO_CMAKE) + " --install '" VEMO_BINARY_DIR "' --prefix '" +
                                               Prefix().string() + "'");
    ASSERT_EQ(installed.status, 0) << installed.output;
  }
  static void TearDownTestSuite() { s_folder.reset(); }

  void SetUp() override {
    if (IsSanitized()) GTEST_SKIP() << "the libraries of this build are instrumented: nothing outside it can link them";
  }

  static bool IsSanitized() { return *VEMO_SANITIZE != '\0'; }
  static std::filesystem::path Folder() { return s_folder->path(); }
  static std::filesystem::path Prefix() { return Folder() / "prefix"; }
  static std::filesystem::path LibraryFolder() { return Prefix() / VEMO_LIBDIR; }

 private:
  static inline std::unique_ptr<TempFolder> s_folder;
};

}  // namespace vemo::test
