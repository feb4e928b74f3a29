#include "daemons/tarnotifyd/fanotify_source.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "fileindex/queue/event.h"
#include "tests/daemons/tarnotifyd/support/fanotify_fixture.h"

namespace quarry::notify {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::IsSubsetOf;
using testing::Not;

class FanotifySourceTest : public FanotifyFixture {
 protected:
  // What is told up to now, without the names of what ended it.
  std::vector<std::string> Told() {
    ReadAll(model_);
    std::vector<std::string> told = model_.Told();
    model_.ForgetTold();
    const auto is_end = [&](const std::string& line) {
      return line.find(inside_ + "/last") != std::string::npos;
    };
    told.erase(std::remove_if(told.begin(), told.end(), is_end), told.end());
    return told;
  }

  bool StartInside() {
    if (!Start({inside_}, model_)) return false;
    EXPECT_THAT(model_.Told(), ElementsAre("doubt " + inside_));
    model_.ForgetTold();
    return true;
  }

  test::DiskModel model_{inside_, {"@eaDir"}};
};

// Runs `check` in a process of an ordinary user, and returns what it returns. Who is root in a user
// namespace cannot become anybody else, and is an ordinary user to the file systems.
int AsAnybody(int (*check)()) {
  const pid_t child = fork();
  if (child == 0) {
    const bool is_root = geteuid() == 0;
    const bool is_alone = is_root && setresuid(65534, 65534, 65534) != 0 && errno == EINVAL;
    _exit(is_root && !is_alone && geteuid() == 0 ? 99 : check());
  }
  int status = 0;
  waitpid(child, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 98;
}

TEST(FanotifyRights, AnOrdinaryUserIsToldClearly) {
  EXPECT_EQ(AsAnybody([] {
              try {
                FanotifySource source;
                return 1;
              } catch (const Error& error) {
                if (error.code() != kErrorSystem) return 2;
                return error.reason().rfind("Cannot use fanotify: ", 0) == 0 ? 0 : 3;
              }
            }),
            0);
}

TEST_F(FanotifySourceTest, EveryKindOfChange) {
  if (!StartInside()) return;
  const std::string file = inside_ + "/f";
  test::WriteFile(file, "one");
  EXPECT_THAT(Told(), ElementsAre("create file " + file));
  test::WriteFile(file, "two");
  EXPECT_THAT(Told(), Contains("modify file " + file));
  chmod(file.c_str(), 0640);
  EXPECT_THAT(Told(), ElementsAre("attr file " + file));
  std::rename(file.c_str(), (inside_ + "/g").c_str());
  EXPECT_THAT(Told(), ElementsAre("rename file " + file + " -> " + inside_ + "/g"));
  unlink((inside_ + "/g").c_str());
  EXPECT_THAT(Told(), ElementsAre("delete file " + inside_ + "/g"));
  mkdir((inside_ + "/d").c_str(), 0700);
  chmod((inside_ + "/d").c_str(), 0755);
  EXPECT_THAT(Told(), ElementsAre("create dir " + inside_ + "/d", "attr dir " + inside_ + "/d"));
  rmdir((inside_ + "/d").c_str());
  EXPECT_THAT(Told(), ElementsAre("delete dir " + inside_ + "/d"));
}

TEST_F(FanotifySourceTest, WhetherTheWriterIsDone) {
  struct Progress : test::DiskModel {
    using DiskModel::DiskModel;
    void OnChange(const Change& change) override {
      if (change.kind == fileindex::EVENT_MODIFY) in_progress.push_back(change.in_progress);
      DiskModel::OnChange(change);
    }
    std::vector<bool> in_progress;
  };
  Progress progress(inside_, {});
  const std::string file = inside_ + "/f";
  test::WriteFile(file, "");
  if (!Start({inside_}, progress)) return;
  const int fd = open(file.c_str(), O_WRONLY | O_CLOEXEC);
  EXPECT_EQ(write(fd, "text", 4), 4);
  ReadAll(progress);
  EXPECT_THAT(progress.in_progress, ElementsAre(true));
  close(fd);
  ReadAll(progress);
  EXPECT_THAT(progress.in_progress, ElementsAre(true, false));
}

TEST_F(FanotifySourceTest, MovesAcrossTheEdge) {
  test::MakeDirs(inside_ + "/d/e");
  if (!StartInside()) return;
  std::rename((inside_ + "/d").c_str(), (outside_ + "/x").c_str());
  EXPECT_THAT(Told(), ElementsAre("delete dir " + inside_ + "/d"));
  test::WriteFile(outside_ + "/x/e/unheard", "");
  EXPECT_THAT(Told(), IsEmpty());
  std::rename((outside_ + "/x").c_str(), (inside_ + "/y").c_str());
  test::WriteFile(inside_ + "/y/e/heard", "");
  EXPECT_THAT(Told(),
              ElementsAre("create dir " + inside_ + "/y", "create file " + inside_ + "/y/e/heard"));
}

TEST_F(FanotifySourceTest, IgnoredNamesAndOutsideAreNotTold) {
  if (!StartInside()) return;
  test::WriteFile(inside_ + "/@eaDir/f", "");
  test::WriteFile(inside_ + "/d/@eaDir/e/f", "");
  test::WriteFile(outside_ + "/f", "");
  EXPECT_THAT(Told(), ElementsAre("create dir " + inside_ + "/d"));
}

TEST_F(FanotifySourceTest, NamesThatAreNoText) {
  if (!StartInside()) return;
  const std::string name = inside_ + "/\xff\n\\\"";
  test::WriteFile(name, "");
  EXPECT_THAT(Told(), ElementsAre("create file " + name));
}

TEST_F(FanotifySourceTest, PathsTooLongToBeOpened) {
  if (!StartInside()) return;
  const std::string name(250, 'n');
  std::string path = inside_;
  int at = open(inside_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
  for (int depth = 0; depth < 20; ++depth) {
    ASSERT_EQ(mkdirat(at, name.c_str(), 0700), 0);
    const int below = openat(at, name.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
    close(at);
    at = below;
    path += "/" + name;
  }
  // Another source has to ask for each directory.
  ReadAll(model_);
  model_.ForgetTold();
  source_ = std::make_unique<FanotifySource>();
  source_->SetDirectories({inside_}, {}, model_);
  model_.ForgetTold();
  close(openat(at, "f", O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
  close(at);
  EXPECT_THAT(Told(), ElementsAre("create file " + path + "/f"));
}

TEST_F(FanotifySourceTest, DirectoryThatAppearsLater) {
  const std::string late = scratch_ / "late";
  if (!Start({inside_, late}, model_)) return;
  EXPECT_THAT(model_.Told(), ElementsAre("doubt " + inside_));
  EXPECT_THAT(source_->Unwatchable(), IsEmpty());
  model_.ForgetTold();
  mkdir(late.c_str(), 0700);
  source_->Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + late));
  test::WriteFile(late + "/f", "");
  source_->Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("create file " + late + "/f"));
}

TEST_F(FanotifySourceTest, DirectoryThatIsReplaced) {
  const std::string place = scratch_ / "place";
  test::MakeDirs(place);
  if (!Start({inside_, place}, model_)) return;
  model_.ForgetTold();
  std::rename(place.c_str(), (scratch_ / "aside").c_str());
  source_->Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + place));
  test::MakeDirs(place);
  source_->Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + place));
  test::WriteFile(place + "/f", "");
  test::WriteFile((scratch_ / "aside") + "/f", "");
  EXPECT_THAT(Told(), ElementsAre("create file " + place + "/f"));
}

TEST_F(FanotifySourceTest, OtherDirectoriesInPlaceOfTheEarlierOnes) {
  test::MakeDirs(inside_ + "/a");
  if (!StartInside()) return;
  source_->SetDirectories({inside_, outside_}, {"@eaDir"}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + outside_));
  test::WriteFile(inside_ + "/a/f", "");
  test::WriteFile(outside_ + "/f", "");
  std::rename((outside_ + "/f").c_str(), (inside_ + "/f").c_str());
  EXPECT_THAT(Told(),
              ElementsAre("create file " + inside_ + "/a/f", "create file " + outside_ + "/f",
                          "rename file " + outside_ + "/f -> " + inside_ + "/f"));
  source_->SetDirectories({inside_}, {"a"}, model_);
  test::WriteFile(inside_ + "/a/g", "");
  test::WriteFile(inside_ + "/@eaDir/g", "");
  test::WriteFile(outside_ + "/g", "");
  EXPECT_THAT(Told(), IsSubsetOf({"create dir " + inside_ + "/@eaDir",
                                  "create file " + inside_ + "/@eaDir/g"}));
  source_->SetDirectories({}, {}, model_);
  test::WriteFile(inside_ + "/h", "");
  source_->Read(model_);
  EXPECT_THAT(model_.Told(), IsEmpty());
}

TEST_F(FanotifySourceTest, DirectoryWithinADirectoryIsToldOnce) {
  test::MakeDirs(inside_ + "/d");
  if (!Start({inside_, inside_ + "/d"}, model_)) return;
  model_.ForgetTold();
  test::WriteFile(inside_ + "/d/f", "");
  EXPECT_THAT(Told(), ElementsAre("create file " + inside_ + "/d/f"));
}

// As a server of NFS does when its client comes back after a while.
TEST_F(FanotifySourceTest, FileThatIsWrittenThroughItsHandle) {
  const std::string file = inside_ + "/f";
  test::WriteFile(file, "");
  if (!StartInside()) return;
  std::vector<char> room(sizeof(file_handle) + MAX_HANDLE_SZ);
  auto* handle = reinterpret_cast<file_handle*>(room.data());
  handle->handle_bytes = MAX_HANDLE_SZ;
  int mount = 0;
  ASSERT_EQ(name_to_handle_at(AT_FDCWD, file.c_str(), handle, &mount, 0), 0);
  const int top = open(inside_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const int fd = open_by_handle_at(top, handle, O_WRONLY | O_CLOEXEC);
  ASSERT_GE(fd, 0);
  EXPECT_EQ(write(fd, "text", 4), 4);
  close(fd);
  close(top);
  ReadAll(model_);
  source_->Refresh(model_);
  EXPECT_THAT(model_.Told(), Contains(HasSubstr("modify file " + file)));
}

// There is nothing to be found where the file was, but it has to be nothing worse than that.
TEST_F(FanotifySourceTest, FileThatHasLostItsNameIsNoReasonForDoubt) {
  const std::string file = inside_ + "/f";
  if (!StartInside()) return;
  const int fd = open(file.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  unlink(file.c_str());
  Told();
  EXPECT_EQ(write(fd, "text", 4), 4);
  close(fd);
  EXPECT_THAT(Told(), IsSubsetOf({"modify file " + file}));
  source_->Refresh(model_);
  EXPECT_THAT(model_.Told(), IsEmpty());
}

// The kernel tells of the last rename in the place of the first, which was the same.
TEST_F(FanotifySourceTest, DirectoryThatIsRenamedToAndFro) {
  const std::string one = inside_ + "/one";
  const std::string other = inside_ + "/other";
  test::MakeDirs(one);
  if (!StartInside()) return;
  std::rename(one.c_str(), other.c_str());
  std::rename(other.c_str(), one.c_str());
  std::rename(one.c_str(), other.c_str());
  EXPECT_THAT(Told(), Contains("rename dir " + one + " -> " + other));
  test::WriteFile(other + "/f", "");
  EXPECT_THAT(Told(), ElementsAre("create file " + other + "/f"));
}

TEST_F(FanotifySourceTest, LinkIsACreationAndNothingElse) {
  test::WriteFile(inside_ + "/f", "");
  if (!StartInside()) return;
  ASSERT_EQ(link((inside_ + "/f").c_str(), (inside_ + "/g").c_str()), 0);
  EXPECT_THAT(Told(), ElementsAre("create file " + inside_ + "/g"));
  source_->Refresh(model_);
  source_->Refresh(model_);
  EXPECT_THAT(Told(), IsEmpty());
}

TEST_F(FanotifySourceTest, LinkInThePlaceOfADirectoryIsNotFollowed) {
  const std::string place = scratch_ / "place";
  test::MakeDirs(place);
  if (!Start({inside_, place}, model_)) return;
  rmdir(place.c_str());
  ASSERT_EQ(symlink(outside_.c_str(), place.c_str()), 0);
  source_->Refresh(model_);
  EXPECT_THAT(source_->Unwatchable(), IsEmpty());
  Told();
  test::WriteFile(outside_ + "/f", "");
  EXPECT_THAT(Told(), IsEmpty());
}

TEST_F(FanotifySourceTest, DirectoryThatIsAwayForAMoment) {
  const std::string place = scratch_ / "above/place";
  test::MakeDirs(place);
  if (!Start({inside_, place}, model_)) return;
  Told();
  std::rename((scratch_ / "above").c_str(), (scratch_ / "aside").c_str());
  std::rename((scratch_ / "aside").c_str(), (scratch_ / "above").c_str());
  EXPECT_THAT(Told(), ElementsAre("doubt " + place, "doubt " + place));
}

TEST_F(FanotifySourceTest, NothingIsReadWhereThereIsNothing) {
  if (!MakeSource()) return;
  source_->Read(model_);
  source_->Refresh(model_);
  EXPECT_THAT(model_.Told(), IsEmpty());
  source_->SetDirectories({"/proc/sys"}, {}, model_);
  EXPECT_THAT(model_.Told(), IsEmpty());
  EXPECT_THAT(source_->Unwatchable(), ElementsAre("/proc/sys"));
}

}  // namespace
}  // namespace quarry::notify
