// What surrounds a repository does not change its edits: configuration and environment.
#include <gtest/gtest.h>

#include <cstdlib>

#include "edit_model.h"
#include "history/edit_source.h"
#include "test_repository.h"

namespace vemo::test {
namespace {

using Strings = std::vector<std::string>;

class GitConfiguration : public ::testing::Test {
 protected:
  // A history in which each of the settings below would show: a rename, changes that lie near one another, a
  // block that can be placed in two ways, lines that the algorithms pair differently, a merge, a path with
  // unusual characters, a submodule, a replaced object, a signature.
  void SetUp() override {
    m_repository.Write("a.c", "/*\n * F\n */\nint f;\n\n/*\n * G\n */\nint g;\n");
    m_repository.Write("b.txt", "1\n2\n3\n4\n5\n6\n7\n8\n9\n");
    m_repository.Write("c.txt", "x\na\nb\nc\nx\nd\nx\n");
    m_repository.Write("\xc3\xa9\t.txt", "accent\n");
    m_repository.Commit();
    m_repository.Write("a.c", "/*\n * F\n */\nint f;\n\n/*\n * N\n */\nint n;\n\n/*\n * G\n */\nint g;\n");
    m_repository.Write("b.txt", "1\ntwo\n3\nfour\n5\n\n7\n8\nnine\n");
    m_repository.Write("c.txt", "d\nx\nx\nc\nb\na\nx\nd\n");
    m_repository.Git({"mv", "\xc3\xa9\t.txt", "z.txt"});
    const std::string second = m_repository.Commit();
    m_repository.Git({"checkout", "-q", "-b", "side"});
    m_repository.Write("s.txt", "side\n");
    m_repository.Commit();
    m_repository.Git({"checkout", "-q", "main"});
    m_repository.Write("m.txt", "main\n");
    m_repository.Commit();
    m_repository.Git({"merge", "-q", "--no-ff", "-m", "merge", "side"});
    m_repository.Git({"update-index", "--add", "--cacheinfo", "160000," + second + ",module"});
    m_repository.CommitIndex();
    m_repository.Git(
        {"update-index", "--cacheinfo", "160000," + m_repository.Git({"rev-parse", "HEAD"}) + ",module"});
    m_repository.CommitIndex();
    ReplaceBlob("HEAD:m.txt", "replaced\nmain\n");
    AddSignedCommit();
    m_expected = Log();
    ASSERT_GT(m_expected.size(), 12u);
  }

  void ReplaceBlob(const std::string& blob, std::string_view content) {
    const std::filesystem::path file = m_repository.folder() / "replacement";
    WriteFile(file, content);
    m_repository.Git({"replace", m_repository.Git({"rev-parse", blob}),
                      m_repository.Git({"hash-object", "-w", file.string()})});
  }

  void AddSignedCommit() {
    const std::filesystem::path file = m_repository.folder() / "commit";
    WriteFile(file,
              "tree " + m_repository.Git({"rev-parse", "HEAD^{tree}"}) + "\nparent " +
                  m_repository.Git({"rev-parse", "HEAD"}) +
                  "\nauthor Signer <s@example.org> 1600000000 +0000\n"
                  "committer Signer <s@example.org> 1600000000 +0000\n"
                  "gpgsig -----BEGIN PGP SIGNATURE-----\n \n x\n -----END PGP SIGNATURE-----\n\nsigned\n");
    m_repository.Git(
        {"update-ref", "HEAD", m_repository.Git({"hash-object", "-t", "commit", "-w", file.string()})});
  }

  Strings Log() {
    const auto source = OpenGitHistory(m_repository.path());
    EditModel model = ReplayAndCheck(*source);
    Strings log = model.log;
    log.insert(log.end(), model.paths.begin(), model.paths.end());
    log.insert(log.end(), model.commits.begin(), model.commits.end());
    const SkippedFiles skipped = source->Skipped();
    for (const std::uint64_t count : {skipped.binary, skipped.symlinks, skipped.submodules}) {
      log.push_back("skipped " + std::to_string(count));
    }
    return log;
  }

  TestRepository m_repository;
  Strings m_expected;
};

TEST_F(GitConfiguration, OfTheUserChangesNothing) {
  const Strings settings = {
      "[diff]\nnoprefix = true",
      "[diff]\nmnemonicPrefix = true",
      "[diff]\nrenames = copies",
      "[diff]\nexternal = false",
      "[diff]\nalgorithm = patience",
      "[diff]\nalgorithm = histogram",
      "[diff]\nalgorithm = minimal",
      "[diff]\nindentHeuristic = false",
      "[diff]\ncontext = 7",
      "[diff]\ninterHunkContext = 9",
      "[diff]\norderFile = " + (m_repository.folder() / "order").string(),
      "[diff]\nrelative = true",
      "[diff]\nsubmodule = log",
      "[diff]\nsubmodule = diff",
      "[diff]\nignoreSubmodules = all",
      "[core]\nuseReplaceRefs = false",
      "[log]\nshowSignature = true\n[gpg]\nprogram = " + (m_repository.folder() / "gpg").string(),
      "[diff]\nsuppressBlankEmpty = true",
      "[diff]\nwordRegex = .",
      "[diff]\ncolorMoved = zebra\nwsErrorHighlight = all",
      "[color]\nui = always\ndiff = always",
      "[core]\nquotePath = false",
      "[core]\nbigFileThreshold = 10",
      "[core]\nabbrev = 5\npager = false",
      "[core]\nattributesFile = " + (m_repository.folder() / "attributes").string(),
      "[core]\nattributesFile = " + (m_repository.folder() / "attributes").string() +
          "\n[diff \"own\"]\nbinary = true",
      "[log]\nshowRoot = false\ndecorate = full\nmailmap = true\ndate = relative",
      "[log]\ndiffMerges = combined\nfollow = true",
      "[format]\npretty = fuller\nnotes = true",
      "[i18n]\nlogOutputEncoding = UTF-16",
      "[mailmap]\nfile = " + (m_repository.folder() / "mailmap").string(),
      "[alias]\nlog = status\nls-tree = status",
  };
  WriteFile(m_repository.folder() / "order", "m.txt\nc.txt\n");
  WriteFile(m_repository.folder() / "attributes", "*.txt -diff\n*.c diff=own\n");
  WriteFile(m_repository.folder() / "mailmap", "Mapped <mapped@example.org> <ada@example.org>\n");
  WriteFile(m_repository.folder() / "gpg", "#!/bin/sh\necho gpg: a signature >&2\n");
  std::filesystem::permissions(m_repository.folder() / "gpg", std::filesystem::perms::owner_all);
  const std::filesystem::path file = m_repository.folder() / "home" / ".gitconfig";
  for (const std::string& setting : settings) {
    WriteFile(file, setting + "\n");
    EXPECT_EQ(Log(), m_expected) << setting;
  }
}

TEST_F(GitConfiguration, OfADiffDriverDoesNotSayWhatIsBinary) {
  m_repository.Write(".gitattributes", "*.txt diff=own\n*.c diff=odd=one\n");
  m_repository.Commit();
  m_expected = Log();
  m_repository.ConfigureUser(
      "[diff \"own\"]\nbinary = true\ntextconv = tac\ncommand = false\nxfuncname = \"^(.*)$\"");
  EXPECT_EQ(Log(), m_expected);
  m_repository.ConfigureUser("[diff \"algorithm=odd\"]\nbinary = false");
  EXPECT_EQ(Log(), m_expected);
}

TEST_F(GitConfiguration, OfTheRepositoryChangesNothing) {
  m_repository.Git({"notes", "add", "-m", "a note"});
  m_repository.Git({"config", "diff.noprefix", "true"});
  m_repository.Git({"config", "color.ui", "always"});
  m_repository.Git({"config", "diff.algorithm", "patience"});
  m_repository.Git({"config", "core.bigFileThreshold", "1"});
  EXPECT_EQ(Log(), m_expected);
}

// Sets variables for the time of one test.
class Environment {
 public:
  explicit Environment(std::vector<std::pair<std::string, std::string>> variables)
      : m_variables(std::move(variables)) {
    for (const auto& [name, value] : m_variables) ::setenv(name.c_str(), value.c_str(), 1);
  }
  ~Environment() {
    for (const auto& [name, value] : m_variables) ::unsetenv(name.c_str());
  }

 private:
  std::vector<std::pair<std::string, std::string>> m_variables;
};

TEST_F(GitConfiguration, OfTheEnvironmentChangesNothing) {
  const Environment environment({{"GIT_DIR", "/nowhere"},
                                 {"GIT_WORK_TREE", "/nowhere"},
                                 {"GIT_INDEX_FILE", "/nowhere"},
                                 {"GIT_OBJECT_DIRECTORY", "/nowhere"},
                                 {"GIT_COMMON_DIR", "/nowhere"},
                                 {"GIT_NAMESPACE", "none"},
                                 {"GIT_EXTERNAL_DIFF", "false"},
                                 {"GIT_DIFF_OPTS", "--unified=4"},
                                 {"GIT_TRACE", "1"},
                                 {"GIT_PAGER", "false"},
                                 {"GIT_NOTES_REF", "refs/notes/x"},
                                 {"GIT_CONFIG_COUNT", "1"},
                                 {"GIT_CONFIG_KEY_0", "diff.noprefix"},
                                 {"GIT_CONFIG_VALUE_0", "true"},
                                 {"LC_ALL", "de_DE.UTF-8"},
                                 {"LANGUAGE", "de"}});
  EXPECT_EQ(Log(), m_expected);
}

}  // namespace
}  // namespace vemo::test
