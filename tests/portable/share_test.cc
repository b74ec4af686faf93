// The share registry and the platform's share records read from it.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <stdexcept>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo/kalo_share.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/share_registry.h"
#include "platform/share_test_root.h"

namespace orvex {
namespace portable {
namespace {

ShareRecord Share(const std::string& name, const std::string& path) {
  ShareRecord share;
  share.name = name;
  share.path = path;
  return share;
}

std::vector<std::string> Names() {
  std::vector<std::string> names;
  for (const ShareRecord& share : LoadShares()) names.push_back(share.name);
  return names;
}

class ShareRegistryTest : public testing::ShareTestRoot {
 protected:
  const std::string registry_ = dir_.Join("etc/orvex/shares.json");
};

TEST_F(ShareRegistryTest, AddUpdateRemoveRoundTripOnExactNamesKeepingTheOrder) {
  EXPECT_TRUE(LoadShares().empty());
  ShareRecord photo = Share("photo", "/srv/данные/photo/");
  photo.readonly = photo.hide_unreadable = true;
  photo.ftp_privilege = 7;
  photo.privileges = {{"alice", "rw"}, {"bob", "ro"}, {"eve", "na"}};
  portable::AddShare(Share("ph", "/srv/ph"));
  portable::AddShare(photo);
  portable::AddShare(Share("Photo", "/srv/Photo"));
  EXPECT_THROW(portable::AddShare(Share("photo", "/srv/other")), std::invalid_argument);
  ShareRecord read;
  ASSERT_TRUE(FindShare("photo", read));
  EXPECT_EQ(read.path, "/srv/данные/photo") << "trailing slash dropped";
  EXPECT_TRUE(read.readonly && read.hide_unreadable && !read.encryption);
  EXPECT_EQ(std::make_pair(read.ftp_privilege, read.privileges),
            std::make_pair(7, photo.privileges));
  struct stat st;
  ASSERT_EQ(::stat(registry_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  UpdateShare(Share("photo", "/srv/new"));
  ASSERT_TRUE(FindShare("photo", read));
  EXPECT_EQ(read.path, "/srv/new");
  EXPECT_TRUE(RemoveShare("ph"));
  EXPECT_FALSE(RemoveShare("ph"));
  EXPECT_EQ(Names(), (std::vector<std::string>{"photo", "Photo"}));
}

TEST_F(ShareRegistryTest, MalformedRegistryNamesTheFileAndTheProblem) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {R"([{"name": "a", "path": "/a"})", "not valid JSON"},
      {R"(["a"])", "share [0]: is not an object"},
      {R"([{"name": "a"}])", "share [0]: key \"path\" is missing"},
      {R"([{"name": "a", "path": "/a", "readonly": "yes"}])", "key \"readonly\" is not a boolean"},
      {R"([{"name": "a", "path": "/a", "read_only": true}])", "unknown key \"read_only\""},
      {R"([{"name": "a", "path": "/a"}, {"name": "a", "path": "/b"}])",
       "share [1]: duplicate name \"a\""},
  };
  for (const auto& [text, problem] : cases) {
    WriteRegistryText(text);
    try {
      LoadShares();
      ADD_FAILURE() << "accepted: " << text;
    } catch (const std::runtime_error& e) {
      const std::string what = e.what();
      EXPECT_EQ(what.rfind(registry_ + ": ", 0), 0u) << what;
      EXPECT_NE(what.find(problem), std::string::npos) << text << " gave: " << what;
    }
  }
  // Adding to a malformed registry leaves it as it was.
  EXPECT_THROW(portable::AddShare(Share("b", "/b")), std::runtime_error);
  EXPECT_EQ(testing::ReadFileText(registry_), cases.back().first);
}

TEST_F(ShareRegistryTest, AddRefusesBadRecordsAndWritesNothing) {
  const std::vector<std::pair<ShareRecord, std::string>> cases = {
      {Share("", "/a"), "name is empty"},
      {Share("a", "srv/a"), "not absolute"},
      {Share("a", "/srv/../etc"), "component"},
      // Bad bytes are shown escaped, never raw on a terminal.
      {Share("a\x01"
             "b",
             "/a"),
       "share \"a\\x01b\": the name contains the control character U+0001"},
      {Share("a\xC2\x85", "/a"), "the name contains the control character U+0085"},
      {Share("a\xFF"
             "b",
             "/a"),
       "share \"a\\xFFb\": the name is not valid UTF-8 (byte 0xFF at offset 1)"},
      {Share("\xE5\x86", "/a"), "not valid UTF-8 (byte 0xE5 at offset 0)"},  // cut short
  };
  for (const auto& [share, problem] : cases) {
    try {
      portable::AddShare(share);
      ADD_FAILURE() << "accepted [" << share.name << "] [" << share.path << "]";
    } catch (const std::invalid_argument& e) {
      EXPECT_NE(std::string(e.what()).find(problem), std::string::npos) << e.what();
    }
  }
  portable::AddShare(Share("写真 Ärger", "/srv/photo"));  // UTF-8 names are fine
  EXPECT_EQ(Names(), std::vector<std::string>{"写真 Ärger"});
}

TEST_F(ShareRegistryTest, AddCheckSeesTheRegistryAndTheStoredRecordAndMayRefuse) {
  portable::AddShare(Share("a", "/srv/a"));
  std::vector<std::string> seen;
  auto refuse = [&seen](const std::vector<ShareRecord>& shares, const ShareRecord& share) {
    for (const ShareRecord& other : shares) seen.push_back(other.name);
    seen.push_back(share.path);
    throw std::logic_error("refused");
  };
  EXPECT_THROW(portable::AddShare(Share("b", "/srv/b//"), refuse), std::logic_error);
  EXPECT_EQ(seen, (std::vector<std::string>{"a", "/srv/b"}));
  EXPECT_EQ(Names(), std::vector<std::string>{"a"}) << "a refused share must not be written";
  portable::AddShare(Share("b", "/srv/b"),
                     [](const std::vector<ShareRecord>&, const ShareRecord&) {});
  EXPECT_EQ(Names(), (std::vector<std::string>{"a", "b"}));
}

// A link or a directory in the registry's place is reported as what it is:
// never read as "no shares", never replaced by the next add.
TEST_F(ShareRegistryTest, ALinkOrDirectoryInTheRegistrysPlaceIsReportedAndKept) {
  WriteRegistryText("[]");
  const std::string real = dir_.Join("etc/orvex/real.json");
  std::filesystem::rename(registry_, real);
  const struct {
    const char* what;
    std::function<void()> make;
    int error_number;
    std::string message;
  } cases[] = {
      {"link to a good registry", [&] { std::filesystem::create_symlink(real, registry_); }, ELOOP,
       registry_ + " is a symbolic link"},
      {"dangling link", [&] { std::filesystem::create_symlink(dir_.Join("gone"), registry_); },
       ELOOP, registry_ + " is a symbolic link"},
      {"directory", [&] { std::filesystem::create_directory(registry_); }, EISDIR,
       registry_ + " is a directory"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    std::filesystem::remove(registry_);
    c.make();
    for (const auto& call : std::vector<std::function<void()>>{
             [] { LoadShares(); }, [] { portable::AddShare(Share("a", "/srv/a")); }}) {
      try {
        call();
        ADD_FAILURE() << "no error";
      } catch (const ShareRegistryError& e) {
        EXPECT_EQ(e.kind(), ShareRegistryError::Kind::kLoad);
        EXPECT_EQ(e.error_number(), c.error_number);
        EXPECT_EQ(e.what(), c.message);
      }
    }
    EXPECT_NE(std::filesystem::symlink_status(registry_).type(),
              std::filesystem::file_type::regular);
  }
  EXPECT_EQ(testing::ReadFileText(real), "[]");
}

// Every state and registry file is saved this way: a link or a directory in
// the target's place fails before anything is written.
TEST_F(ShareRegistryTest, AtomicWriteRefusesALinkOrADirectoryAndLeavesNothingBehind) {
  const std::string dir = dir_.Join("state");
  std::filesystem::create_directories(dir + "/sub");
  testing::TempDir outside;
  std::filesystem::create_symlink(outside.Join("target"), dir + "/link");
  errno = 0;
  EXPECT_FALSE(WriteFileAtomic(dir + "/link", "new"));
  EXPECT_EQ(errno, ELOOP);
  EXPECT_FALSE(WriteFileAtomic(dir + "/sub", "new"));
  EXPECT_EQ(errno, EISDIR);
  EXPECT_TRUE(std::filesystem::is_symlink(dir + "/link"));
  EXPECT_FALSE(std::filesystem::exists(outside.Join("target")));
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(dir), {}), 2)
      << "temporary file left";
  ASSERT_TRUE(WriteFileAtomic(dir + "/file", "data"));
  EXPECT_EQ(testing::ReadFileText(dir + "/file"), "data");
}

TEST_F(ShareRegistryTest, ConcurrentAddsFromProcessesAllLand) {
  std::vector<pid_t> children;
  for (int p = 0; p < 8; ++p) {
    const pid_t pid = ::fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
      int failures = 0;
      for (int i = 0; i < 6; ++i) {
        const std::string name = "s" + std::to_string(p) + "_" + std::to_string(i);
        try {
          portable::AddShare(Share(name, "/srv/" + name));
        } catch (...) {
          ++failures;
        }
      }
      ::_exit(failures);
    }
    children.push_back(pid);
  }
  for (pid_t pid : children) {
    int status = 0;
    ASSERT_EQ(::waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  }
  EXPECT_EQ(Names().size(), 48u);
}

using KaloShareTest = testing::ShareTestRoot;

TEST_F(KaloShareTest, ReadsFlagsAndFailsWithDistinctErrors) {
  PKALOSHARE share = reinterpret_cast<PKALOSHARE>(0x1);
  EXPECT_LT(KALOShareGet("photo", &share), 0) << "no registry: no shares";
  EXPECT_EQ(share, nullptr);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_SHARE);
  WriteRegistryText(R"([{"name": "enc", "path": "/v/e/", "encryption": true},
                    {"name": "gone", "path": "/nonexistent/orvex/gone", "recycle_bin": true}])");
  ASSERT_EQ(KALOShareGet("enc", &share), 0);
  EXPECT_STREQ(share->szPath, "/v/e");
  bool encryption = false, recycle = true;
  EXPECT_EQ(KLIBShareIsEncryptionGet(share, &encryption), 0);
  EXPECT_EQ(KLIBShareRecycleStatusGet(share, &recycle), 0);
  EXPECT_TRUE(encryption && !recycle) << "each flag from its own key";
  KALOShareFree(share);
  ASSERT_EQ(KALOShareGet("gone", &share), 0);
  EXPECT_LT(KALOShareUserPrivGet("nobody", share), 0);  // the root directory is missing
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_IO);
  KALOShareFree(share);
  WriteRegistryText(R"([{"name": "photo", "path": "/v/photo"},])");
  EXPECT_LT(KALOShareGet("photo", &share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_SHARE_REGISTRY);
}

TEST_F(KaloShareTest, ListedPrivilegesWinOverTheDirectoryMode) {
  // Modes for "nobody": r without x gives nothing, the owner class decides.
  const std::vector<std::tuple<uid_t, mode_t, int>> cases = {{0, 0755, KALO_SHARE_PRIV_RO},
                                                             {0, 0774, KALO_SHARE_PRIV_NA},
                                                             {65534, 0077, KALO_SHARE_PRIV_NA}};
  ShareRecord team = Share("team", dir_.path());
  team.privileges = {{"nobody", "rw"}, {"ghost", "ro"}};
  portable::AddShare(team);
  portable::AddShare(Share("plain", dir_.path()));
  PKALOSHARE share = nullptr;
  ASSERT_EQ(KALOShareGet("team", &share), 0);
  EXPECT_EQ(KALOShareUserPrivGet("nobody", share), KALO_SHARE_PRIV_RW);
  EXPECT_EQ(KALOShareUserPrivGet("ghost", share), KALO_SHARE_PRIV_RO) << "needs no system user";
  KALOShareFree(share);
  for (const auto& [owner, mode, nobody] : cases) {
    ASSERT_EQ(::chown(dir_.path().c_str(), owner, 0), 0);
    ASSERT_EQ(::chmod(dir_.path().c_str(), mode), 0);
    ASSERT_EQ(KALOShareGet("plain", &share), 0);
    EXPECT_EQ(KALOShareUserPrivGet("nobody", share), nobody) << mode;
    EXPECT_EQ(KALOShareUserPrivGet("root", share), KALO_SHARE_PRIV_RW) << mode;
    KALOShareFree(share);
  }
}

}  // namespace
}  // namespace portable
}  // namespace orvex
