// The installed package as other projects use it: by CMake, by pkg-config, and as a folder of theirs.
#include <fstream>
#include <vector>

#include "tests/package/installed_package.h"

namespace vemo::test {
namespace {

namespace fs = std::filesystem;

constexpr char kOwnHostOutput[] =
    "insert: 21 records written, 21 kept\n"
    "fields: 1000, tombstones: 2000\n"
    "delete: 2 records written, 2 kept\n"
    "998:0.3 [........**]{[8,10)}\n"
    "999:0.3 [.........**]{[9,11)}\n"
    "1000:0.3 [**]{[0,2)}\n"
    "clear: 1 records written, 1 kept\n";
constexpr char kStoreOutput[] = "[....***]{[4,7)}\nfindings: 0\nerrors arrive by their types\n";
constexpr char kHistoryOutput[] = "edits applied\ncontent matches\n";

std::vector<std::string> Components() {
  if (VEMO_HAS_HISTORY) return {"maps", "store", "history"};
  return {"maps", "store"};
}

std::string Joined(const std::vector<std::string>& words, const char* between) {
  std::string joined;
  for (const std::string& word : words) joined += (joined.empty() ? "" : between) + word;
  return joined;
}

class Package : public InstalledPackage {
 protected:
  // Copies the sources of a project to a place outside the tree, with the example of a host as its program for the maps.
  static fs::path CopyProject(const std::string& name) {
    const fs::path source = fs::path(VEMO_SOURCE_DIR) / "tests/package" / name;
    const fs::path copy = Folder() / testing::UnitTest::GetInstance()->current_test_info()->name();
    fs::copy(source, copy, fs::copy_options::recursive);
    fs::copy(fs::path(VEMO_SOURCE_DIR) / "tests/package/consumer", copy,
             fs::copy_options::recursive | fs::copy_options::skip_existing);
    fs::copy(fs::path(VEMO_SOURCE_DIR) / "examples/own_host", copy / "maps");
    return copy;
  }

  static CommandResult Configure(const fs::path& project, const std::string& options) {
    return RunCommand("cd '" + project.string() + "' && " VEMO_CMAKE
                      " -G Ninja -S . -B build -DCMAKE_CXX_COMPILER='" VEMO_CXX "' " +
                      options);
  }

  static CommandResult ConfigureConsumer(const fs::path& project, const std::string& components) {
    return Configure(project, "-DCMAKE_PREFIX_PATH='" + Prefix().string() + "' '-DCOMPONENTS=" + components + "'");
  }

  static void Build(const fs::path& project) {
    const CommandResult built = RunCommand(VEMO_CMAKE " --build '" + (project / "build").string() + "'");
    ASSERT_EQ(built.status, 0) << built.output;
  }

  // Runs the program for a component and compares what it prints.
  static void ExpectRuns(const fs::path& program, const std::string& component) {
    const std::string argument = component == "store"     ? (program.parent_path() / "space").string()
                                 : component == "history" ? VEMO_SOURCE_DIR "/examples/session.json"
                                                          : "";
    const CommandResult run = RunCommand("LD_LIBRARY_PATH='" + LibraryFolder().string() + "' '" + program.string() +
                                         "' '" + argument + "'");
    EXPECT_EQ(run.status, 0) << program;
    EXPECT_EQ(run.output, component == "store" ? kStoreOutput : component == "history" ? kHistoryOutput : kOwnHostOutput);
  }
};

TEST_F(Package, IsFoundByCMakeWithAllItsComponents) {
  const fs::path project = CopyProject("consumer");
  const CommandResult configured = ConfigureConsumer(project, Joined(Components(), ";"));
  ASSERT_EQ(configured.status, 0) << configured.output;
  Build(project);
  for (const std::string& component : Components()) ExpectRuns(project / "build" / ("use_" + component), component);
}

// A program that has a copy of the module beside the one in the shared store would have two of everything that is compared
// by its address. So would one that hides its own symbols, if the headers let it.
#if VEMO_SHARED
TEST_F(Package, SharesTheModuleOfTheSharedStore) {
  const fs::path project = CopyProject("consumer");
  const CommandResult configured = Configure(
      project, "-DCMAKE_PREFIX_PATH='" + Prefix().string() + "' -DCMAKE_CXX_FLAGS='-fvisibility=hidden " +
                   "-fvisibility-inlines-hidden' '-DCOMPONENTS=store;history'");
  ASSERT_EQ(configured.status, 0) << configured.output;
  Build(project);
  for (const std::string component : {"store", "history"}) {
    const fs::path program = project / "build" / ("use_" + component);
    const CommandResult defined = RunCommand("nm -C --defined-only '" + program.string() + "' | grep ' [TDBR] vemo::'");
    EXPECT_EQ(defined.output, "");
    ExpectRuns(program, component);
  }
}
#endif

TEST_F(Package, GivesTheMapsAloneWithoutLookingForAnEngine) {
  const fs::path project = CopyProject("consumer");
  const CommandResult configured = ConfigureConsumer(project, "maps");
  ASSERT_EQ(configured.status, 0) << configured.output;
  Build(project);
  ExpectRuns(project / "build/use_maps", "maps");
}

TEST_F(Package, IsFoundByPkgConfig) {
  const fs::path project = CopyProject("consumer");
  for (const std::string& component : Components()) {
    const std::string package = "vemo-" + component;
    const fs::path program = project / component / "program";
    const CommandResult built = RunCommand(
        "cd '" + (project / component).string() + "' && export PKG_CONFIG_PATH='" +
        (LibraryFolder() / "pkgconfig").string() + "' && '" VEMO_CXX "' -std=c++20 *.cc -o program $(pkg-config --cflags " +
        package + ") $(pkg-config " + (VEMO_SHARED ? "" : "--static ") + "--libs " + package + ")");
    ASSERT_EQ(built.status, 0) << built.output;
    ExpectRuns(program, component);
  }
}

TEST_F(Package, MayBeMoved) {
  const fs::path project = CopyProject("consumer");
  const fs::path moved = project / "elsewhere";
  fs::copy(Prefix(), moved, fs::copy_options::recursive | fs::copy_options::copy_symlinks);
  for (const auto& entry : fs::recursive_directory_iterator(moved / VEMO_LIBDIR)) {
    if (entry.path().extension() != ".cmake" && entry.path().extension() != ".pc") continue;
    std::ifstream file(entry.path());
    for (std::string line; std::getline(file, line);) {
      EXPECT_EQ(line.find(Folder().string()), std::string::npos) << entry.path() << ": " << line;
      EXPECT_EQ(line.find(VEMO_SOURCE_DIR), std::string::npos) << entry.path() << ": " << line;
    }
  }
  const CommandResult flags = RunCommand("PKG_CONFIG_PATH='" + (moved / VEMO_LIBDIR / "pkgconfig").string() +
                                         "' pkg-config --cflags --libs vemo-store");
  EXPECT_NE(flags.output.find(project.string()), std::string::npos) << flags.output;
  EXPECT_EQ(flags.output.find(Prefix().string()), std::string::npos) << flags.output;
}

TEST_F(Package, BringsTheCommand) {
  const CommandResult run = RunCommand("'" + (Prefix() / "bin/vemo").string() + "' --help");
  EXPECT_EQ(run.status, 0) << run.output;
  EXPECT_NE(run.output.find("replay"), std::string::npos) << run.output;
}

TEST_F(Package, NamesItsComponentsWhenAskedForAnother) {
  const CommandResult configured = ConfigureConsumer(CopyProject("consumer"), "mops");
  EXPECT_NE(configured.status, 0);
  EXPECT_NE(configured.output.find("vemo has no component \"mops\"; it has maps, store and history."), std::string::npos)
      << configured.output;
}

TEST_F(Package, SaysThatItWasBuiltWithoutAComponent) {
  const fs::path project = CopyProject("consumer");
  const fs::path moved = project / "elsewhere";
  fs::copy(Prefix(), moved, fs::copy_options::recursive | fs::copy_options::copy_symlinks);
  fs::remove(moved / VEMO_LIBDIR / "cmake/vemo/vemo-history-targets.cmake");
  const CommandResult configured =
      Configure(project, "-DCMAKE_PREFIX_PATH='" + moved.string() + "' '-DCOMPONENTS=store;history'");
  EXPECT_NE(configured.status, 0);
  EXPECT_NE(configured.output.find("was built without its component \"history\""), std::string::npos)
      << configured.output;
}

#if !VEMO_SHARED
TEST_F(Package, SaysWhichLibraryIsMissing) {
  const CommandResult configured =
      Configure(CopyProject("consumer"),
                "-DCMAKE_PREFIX_PATH='" + Prefix().string() + "' -DCOMPONENTS=store -DCMAKE_DISABLE_FIND_PACKAGE_LMDB=ON");
  EXPECT_NE(configured.status, 0);
  EXPECT_NE(configured.output.find("is linked with LMDB, which was not found"), std::string::npos) << configured.output;
}
#endif

TEST_F(Package, CanBeAFolderOfAnotherProject) {
  const fs::path project = CopyProject("subproject");
  const CommandResult configured = Configure(project, "-DVEMO_SOURCE='" VEMO_SOURCE_DIR "'");
  ASSERT_EQ(configured.status, 0) << configured.output;
  const CommandResult built = RunCommand(VEMO_CMAKE " --build '" + (project / "build").string() + "'");
  ASSERT_EQ(built.status, 0) << built.output;
  EXPECT_EQ(built.output.find("unused_function"), std::string::npos) << built.output;
  ExpectRuns(project / "build/use_maps", "maps");
}

#if defined(VEMO_OWN_HOST)
TEST(OwnHost, KeepsTheMapsWithoutAStore) {
  const CommandResult run = RunCommand("'" VEMO_OWN_HOST "'");
  EXPECT_EQ(run.status, 0);
  EXPECT_EQ(run.output, kOwnHostOutput);
}
#endif

}  // namespace
}  // namespace vemo::test
