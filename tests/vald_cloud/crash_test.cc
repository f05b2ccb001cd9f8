// The process ends, or the disk refuses, at every step that an operation takes.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>

#include "linux/vald/cloud/CloudRecovery.h"
#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

const VLFileObjectID kDocument = documentNumber(3);
constexpr int kDone = 0;
constexpr int kFailed = 1;
constexpr std::uint64_t kMostSteps = 200;

class Unhindered final : public StreamObserver {
 public:
  NSErrorPtr didPass(std::uint64_t) override { return nullptr; }
};

// A document as it is before or after; "between" for anything else.
class CrashTest : public testing::Test {
 protected:
  using Operation = std::function<NSErrorPtr(CloudRig&, const std::string& path)>;

  static std::string path(const CloudRig& rig) { return (rig.top / "drive/a").string(); }

  // A fresh drive with one tagged document that is uploaded, and evicted when `away`.
  static void prepare(CloudRig& rig, bool uploaded, bool away) {
    const std::string file = rig.write("a", std::string(600'000, 'a'));
    ASSERT_EQ(chmod(file.c_str(), 0604), 0);
    setTags(file, "red");
    if (!uploaded) return;
    ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, file)));
    if (away) {
      ASSERT_EQ(brief(rig.evict(kDocument, file)), "none");
    }
  }

  static std::string stateOf(CloudRig& rig) {
    const auto names = rig.names();
    if (names == std::vector<std::string>{"a"}) return "here " + portraitOf(path(rig));
    if (names == std::vector<std::string>{".a.skein"}) return "away";
    std::string text = "between:";
    for (const std::string& name : names) text += " " + name;
    return text;
  }

  // What the records say holds of the contents, too.
  static void checkCloud(CloudRig& rig) {
    const auto record = rig.records->record(kDocument);
    ASSERT_TRUE(record);
    if (!*record) return;
    Unhindered observer;
    EXPECT_EQ(brief(rig.contents->verify((*record)->contents.hash, observer)), "none");
  }

  // Kills a process of its own at each step of `operation` in turn.
  static void killAtEachStep(bool away, const Operation& operation) {
    std::uint64_t step = 1;
    for (bool done = false; !done; ++step) {
      ASSERT_LT(step, kMostSteps);
      SCOPED_TRACE("step " + std::to_string(step));
      const TemporaryFolder folder;
      std::string whole;
      {
        CloudRig rig(folder.path());
        prepare(rig, true, false);
        whole = stateOf(rig);
        if (away) {
          ASSERT_EQ(brief(rig.evict(kDocument, path(rig))), "none");
        }
      }
      const pid_t child = fork();
      if (child == 0) {
        CloudRig rig(folder.path());
        rig.files.crashAt(step);
        _exit(operation(rig, path(rig)) == nullptr ? kDone : kFailed);
      }
      int status = 0;
      ASSERT_EQ(waitpid(child, &status, 0), child);
      ASSERT_TRUE(WIFEXITED(status));
      done = WEXITSTATUS(status) == kDone;
      ASSERT_TRUE(done || WEXITSTATUS(status) == FaultyFileLayer::kCrashStatus);

      CloudRig rig(folder.path());
      // Before anything is mended: one of the two is there.
      const auto names = rig.names();
      EXPECT_TRUE(std::count(names.begin(), names.end(), "a") +
                  std::count(names.begin(), names.end(), ".a.skein"));
      ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
      const std::string after = stateOf(rig);
      EXPECT_TRUE(after == whole || after == "away") << after;
      if (done) {
        EXPECT_EQ(after == "away", !away);
      }
      EXPECT_TRUE(rig.records->unfinishedWork()->empty());
      EXPECT_TRUE(std::filesystem::is_empty(rig.top / "cloud/incoming"));
      checkCloud(rig);
      // And everything goes on from there.
      if (after == "away") {
        EXPECT_EQ(brief(rig.download(kDocument, path(rig))), "none");
      }
      EXPECT_EQ(stateOf(rig), whole);
      EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path(rig))));
      EXPECT_EQ(brief(rig.evict(kDocument, path(rig))), "none");
    }
    EXPECT_GT(step, 5u);
  }

  // Fails each step in turn with `code`: an error means that nothing happened.
  static void failAtEachStep(bool away, int code, const Operation& operation) {
    std::uint64_t step = 1;
    for (bool met = true; met; ++step) {
      ASSERT_LT(step, kMostSteps);
      SCOPED_TRACE("step " + std::to_string(step) + ", errno " + std::to_string(code));
      const TemporaryFolder folder;
      CloudRig rig(folder.path());
      prepare(rig, true, away);
      rig.files.failAt(step, code);
      const NSErrorPtr error = operation(rig, path(rig));
      met = rig.files.met();
      rig.files.failAt(0, 0);
      if (error != nullptr) {
        EXPECT_NE(error->localizedDescription(), "");
      }
      EXPECT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
      const bool isAway = stateOf(rig) == "away";
      EXPECT_EQ(stateOf(rig).find("between"), std::string::npos) << stateOf(rig);
      EXPECT_EQ(isAway, error != nullptr ? away : !away);
    }
    EXPECT_GT(step, 5u);
  }

  static NSErrorPtr evict(CloudRig& rig, const std::string& path) {
    return rig.evict(kDocument, path);
  }
  static NSErrorPtr download(CloudRig& rig, const std::string& path) {
    return rig.download(kDocument, path);
  }
};

TEST_F(CrashTest, KilledWhileEvicting) { killAtEachStep(false, evict); }

TEST_F(CrashTest, KilledWhileDownloading) { killAtEachStep(true, download); }

TEST_F(CrashTest, RefusedByTheDisk) {
  for (const int code : {ENOSPC, EACCES}) {
    failAtEachStep(false, code, evict);
    failAtEachStep(true, code, download);
  }
}

TEST_F(CrashTest, KilledWhileUploading) {
  std::uint64_t step = 1;
  for (bool done = false; !done; ++step) {
    ASSERT_LT(step, kMostSteps);
    const TemporaryFolder folder;
    const pid_t child = fork();
    if (child == 0) {
      CloudRig rig(folder.path());
      prepare(rig, false, false);
      rig.files.crashAt(step);
      const auto result = rig.upload(kDocument, path(rig));
      _exit(std::holds_alternative<UploadDone>(result) ? kDone : kFailed);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    done = WEXITSTATUS(status) == kDone;
    ASSERT_TRUE(done || WEXITSTATUS(status) == FaultyFileLayer::kCrashStatus);
    CloudRig rig(folder.path());
    EXPECT_EQ(static_cast<bool>(*rig.records->record(kDocument)), done);
    checkCloud(rig);
    EXPECT_TRUE(std::filesystem::is_empty(rig.top / "cloud/incoming"));
    EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path(rig))));
    checkCloud(rig);
  }
  EXPECT_GT(step, 5u);
}

}  // namespace
}  // namespace skein::vald
