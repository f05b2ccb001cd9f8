// One worker process: what it draws, what hostile documents cost, and that its limits bite.
#include <fcntl.h>
#include <pthread.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "linux/thumbnailer/Fonts.h"
#include "linux/thumbnailer/LockDown.h"
#include "tests/vald_thumbnails/RenderRig.h"

namespace skein::vald {
namespace {

using samples::fileWith;

class WorkerTest : public testing::Test {
 protected:
  std::shared_ptr<RenderWorker> start() {
    auto started = RenderWorker::start(options);
    EXPECT_EQ(failureOf(started.error()), "none");
    return started ? std::move(*started) : nullptr;
  }
  Outcome<RenderedPicture> draw(RenderWorker& worker, PictureKind kind, const std::string& bytes,
                                std::uint32_t side = 256) {
    const FileDescriptor document = fileWith(bytes);
    return worker.render({kind, PictureFormat::Any, side, document.get()}, cancellation);
  }

  RenderWorker::Options options = workerOptions();
  Cancellation cancellation;
};

TEST_F(WorkerTest, DrawsEachKindWithinTheSideThatIsAskedFor) {
  const auto worker = start();
  ASSERT_NE(worker, nullptr);
  EXPECT_EQ(worker->greeting().kinds, 0b1111111u) << "a loader is missing";
  struct Case {
    PictureKind kind;
    PictureFormat format;
    std::uint32_t width, height;
  };
  // Photographs are made smaller alone; drawings and pages fill the side.
  for (const Case& wanted : {Case{PictureKind::Jpeg, PictureFormat::Jpeg, 256, 171},
                             Case{PictureKind::Png, PictureFormat::Jpeg, 256, 171},
                             Case{PictureKind::WebP, PictureFormat::Jpeg, 256, 171},
                             Case{PictureKind::Gif, PictureFormat::Jpeg, 2, 1},
                             Case{PictureKind::Svg, PictureFormat::Png, 256, 171},
                             Case{PictureKind::Pdf, PictureFormat::Jpeg, 256, 171},
                             Case{PictureKind::Text, PictureFormat::Jpeg, 181, 256}}) {
    SCOPED_TRACE(pictureKindName(wanted.kind));
    const auto drawn = draw(*worker, wanted.kind, samples::picture(wanted.kind));
    ASSERT_EQ(failureOf(drawn.error()), "none");
    EXPECT_EQ(drawn->width, wanted.width);
    EXPECT_EQ(drawn->height, wanted.height);
    EXPECT_EQ(drawn->format, wanted.format);
    EXPECT_TRUE(
        drawn->bytes.starts_with(wanted.format == PictureFormat::Jpeg ? "\xff\xd8" : "\x89P"));
  }
  EXPECT_TRUE(worker->isUsable());
  const auto large =
      draw(*worker, PictureKind::Jpeg, samples::picture(PictureKind::Jpeg, 4000, 3000), 1024);
  ASSERT_EQ(failureOf(large.error()), "none");
  EXPECT_EQ(large->width, 1024u);
  EXPECT_EQ(large->height, 768u);
  EXPECT_FALSE(worker->isUsable()) << "one process sees few documents";
}

TEST_F(WorkerTest, AHostileDocumentIsAnErrorAndTheWorkerGoesOn) {
  const auto worker = start();
  ASSERT_NE(worker, nullptr);
  const auto cut = [](PictureKind kind) {
    const std::string bytes = samples::picture(kind);
    return bytes.substr(0, bytes.size() * 2 / 3);
  };
  struct Case {
    const char* name;
    PictureKind kind;
    std::string bytes;
    RenderFailure failure;
  };
  std::vector<Case> cases{
      {"JPEG cut off", PictureKind::Jpeg, cut(PictureKind::Jpeg), RenderFailure::Malformed},
      {"PNG cut off", PictureKind::Png, cut(PictureKind::Png), RenderFailure::Malformed},
      {"WebP cut off", PictureKind::WebP, cut(PictureKind::WebP), RenderFailure::Malformed},
      {"GIF cut off", PictureKind::Gif, cut(PictureKind::Gif), RenderFailure::Malformed},
      {"SVG cut off", PictureKind::Svg, cut(PictureKind::Svg), RenderFailure::Malformed},
      {"PDF of a line", PictureKind::Pdf, "%PDF-1.4\n", RenderFailure::Malformed},
      {"PNG bomb", PictureKind::Png, samples::pngOfZeros(60'000, 60'000, 1'000),
       RenderFailure::TooLarge},
      {"JPEG bomb", PictureKind::Jpeg, samples::jpegThatClaims(65'000, 65'000),
       RenderFailure::TooLarge},
      {"GIF bomb", PictureKind::Gif, samples::gifThatClaims(65'000, 65'000),
       RenderFailure::TooLarge},
      {"deep SVG", PictureKind::Svg, samples::deepSvg(100'000), RenderFailure::Malformed},
      {"swelling SVG", PictureKind::Svg, samples::swellingSvg(), RenderFailure::Malformed},
      {"SVG of a file", PictureKind::Svg,
       "<!DOCTYPE svg [<!ENTITY e SYSTEM 'file:///etc/passwd'>]>"
       "<svg xmlns='http://www.w3.org/2000/svg'><text>&e;",
       RenderFailure::Malformed},
      {"binary text", PictureKind::Text, samples::picture(PictureKind::Png),
       RenderFailure::Malformed},
      {"blank text", PictureKind::Text, " \n\t\n", RenderFailure::Empty},
  };
  for (std::uint32_t number = 0; number < kPictureKinds; ++number) {
    const auto kind = static_cast<PictureKind>(number);
    cases.push_back({"nothing", kind, "", RenderFailure::Empty});
    const auto other = kind == PictureKind::Jpeg ? PictureKind::Png : PictureKind::Jpeg;
    cases.push_back({"another type", kind, samples::picture(other), RenderFailure::Malformed});
  }
  for (const Case& hostile : cases) {
    SCOPED_TRACE(std::string(hostile.name) + ", " + std::string(pictureKindName(hostile.kind)));
    const auto drawn = draw(*worker, hostile.kind, hostile.bytes);
    EXPECT_EQ(failureOf(drawn.error()), failureText(hostile.failure));
    EXPECT_TRUE(isAboutDocument(drawn.error()));
  }
  EXPECT_EQ(failureOf(draw(*worker, PictureKind::Png, samples::picture(PictureKind::Png)).error()),
            "none");
  EXPECT_EQ(kill(worker->processID(), 0), 0);
}

TEST_F(WorkerTest, ADocumentThatTakesTooLongEndsTheWorker) {
  options.processorTime = std::chrono::seconds(1);
  const auto busy = start();
  ASSERT_NE(busy, nullptr);
  const auto slow = draw(*busy, PictureKind::Pdf, samples::slowPdf(9));
  EXPECT_EQ(failureOf(slow.error()), failureText(RenderFailure::TookTooLong));
  EXPECT_NE(slow.error()->localizedDescription().find("processor"), std::string::npos);
  EXPECT_FALSE(busy->isUsable());

  options = workerOptions();
  options.patience = std::chrono::milliseconds(200);
  const auto waited = start();
  ASSERT_NE(waited, nullptr);
  const auto late = draw(*waited, PictureKind::Pdf, samples::slowPdf(9));
  EXPECT_EQ(failureOf(late.error()), failureText(RenderFailure::NotInTime));
  EXPECT_FALSE(isAboutDocument(late.error()));  // the machine may have been busy
  EXPECT_FALSE(waited->isUsable());
}

TEST_F(WorkerTest, APictureIsInMemoryOnce) {
  const auto worker = start();
  ASSERT_NE(worker, nullptr);
  // 100 MB from a file of 160 KB.
  const auto drawn = draw(*worker, PictureKind::Png, samples::pngOfZeros(5'000, 5'000, 5'000));
  EXPECT_EQ(failureOf(drawn.error()), "none");
  std::ifstream status("/proc/" + std::to_string(worker->processID()) + "/status");
  std::uint64_t peak = 0;
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("VmHWM:")) peak = std::stoull(line.substr(6));
  }
  EXPECT_GT(peak, 0u);
  EXPECT_LT(peak, 300u << 10);  // in KiB, with what a sanitizer takes
}

TEST_F(WorkerTest, IsLockedDownBeforeItsFirstDocument) {
  const auto worker = start();
  ASSERT_NE(worker, nullptr);
  std::ostringstream text;
  text << std::ifstream("/proc/" + std::to_string(worker->processID()) + "/status").rdbuf()
       << std::ifstream("/proc/" + std::to_string(worker->processID()) + "/limits").rdbuf();
  const std::string state = text.str();
  EXPECT_NE(state.find("NoNewPrivs:\t1"), std::string::npos);
  EXPECT_NE(state.find("Max open files            16 "), std::string::npos) << state;
  EXPECT_NE(state.find("Max core file size        0 "), std::string::npos);
  EXPECT_NE(state.find("Max cpu time              600 "), std::string::npos);
  EXPECT_NE(state.find("Seccomp:\t2"), std::string::npos);
#ifndef SKEIN_SANITIZED
  EXPECT_NE(state.find("Max address space         1073741824 "), std::string::npos);
#endif
  EXPECT_EQ(getpriority(PRIO_PROCESS, static_cast<id_t>(worker->processID())), 10);
}

// What the child of the next test tries; each of them must fail. The number of the first
// that did not, or 0.
int tryEverything(const std::string& ownFile) {
  int attempt = 0;
  const auto succeeded = [&attempt](bool success) {
    ++attempt;
    return success;
  };
  if (succeeded(open("/etc/passwd", O_RDONLY) >= 0)) return attempt;
  if (succeeded(open(ownFile.c_str(), O_RDONLY) >= 0)) return attempt;
  if (succeeded(open(ownFile.c_str(), O_WRONLY | O_CREAT, 0600) >= 0)) return attempt;
  if (succeeded(open("/usr/share/fonts/new", O_WRONLY | O_CREAT, 0600) >= 0)) return attempt;
  if (succeeded(unlink(ownFile.c_str()) == 0)) return attempt;
  if (succeeded(socket(AF_UNIX, SOCK_STREAM, 0) >= 0)) return attempt;
  if (succeeded(socket(AF_INET, SOCK_STREAM, 0) >= 0)) return attempt;
  if (succeeded(kill(getppid(), 0) == 0)) return attempt;
  if (succeeded(prctl(PR_SET_DUMPABLE, 1, 0, 0, 0) == 0)) return attempt;
  if (succeeded(mmap(nullptr, 4096, PROT_READ | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) !=
                MAP_FAILED)) {
    return attempt;
  }
#ifndef SKEIN_SANITIZED
  if (succeeded(mmap(nullptr, thumbnailer::kAddressSpace, PROT_READ,
                     MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0) != MAP_FAILED)) {
    return attempt;
  }
#endif
  struct stat status {};
  if (succeeded(fstatat(AT_FDCWD, "/etc/passwd", &status, 0) == 0)) return attempt;
  if (succeeded(fstatat(AT_FDCWD, "/etc/passwd", &status, AT_EMPTY_PATH) == 0)) return attempt;
  struct statx extended {};
  if (succeeded(statx(AT_FDCWD, "/etc/passwd", 0, STATX_SIZE, &extended) == 0)) return attempt;
  const pid_t child = fork();
  if (child == 0) _exit(0);
  if (succeeded(child > 0)) return attempt;
  char* const arguments[] = {nullptr};
  execve("/bin/true", arguments, arguments);
  return 0;
}

TEST(LockDownTest, ALockedDownProcessOpensNothingAndReachesNobody) {
  const TemporaryFolder folder;
  const std::string ownFile = (folder.path() / "document").string();
  std::ofstream(ownFile) << "words";
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    auto fonts = thumbnailer::prepareFonts();
    std::erase_if(fonts, [](const std::string& name) { return !std::filesystem::exists(name); });
    const auto outcome = thumbnailer::lockDown(fonts);
    if (!outcome.problem.empty()) _exit(100);
    if (!fonts.empty() && outcome.hasFonts &&
        open(fonts.front().c_str(), O_RDONLY | O_DIRECTORY) < 0)
      _exit(101);
    _exit(tryEverything(ownFile));
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status)) << "signal " << WTERMSIG(status);
  EXPECT_EQ(WEXITSTATUS(status), 0) << "the attempt of this number succeeded";
  EXPECT_EQ(contentsOf(ownFile), "words");
}

void* waitForEver(void* /*nothing*/) {
  for (;;) sched_yield();
}

TEST(LockDownTest, ALockedDownProcessStartsFewThreads) {
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    // Limits of this kind are not for root.
    if (getuid() == 0 && (setgid(65534) != 0 || setuid(65534) != 0)) _exit(100);
    const pid_t trial = fork();
    if (trial == 0) _exit(unshare(CLONE_NEWUSER) == 0 ? 0 : 1);
    int outcome = 0;
    if (waitpid(trial, &outcome, 0) != trial || outcome != 0) _exit(100);
    if (!thumbnailer::lockDown({}).problem.empty()) _exit(101);
    int threads = 0;
    pthread_t thread{};
    while (threads < 80 && pthread_create(&thread, nullptr, &waitForEver, nullptr) == 0) ++threads;
    _exit(threads);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status)) << "signal " << WTERMSIG(status);
  if (WEXITSTATUS(status) == 100) GTEST_SKIP() << "no name space of users on this machine";
  EXPECT_GT(WEXITSTATUS(status), 0);
  EXPECT_LT(WEXITSTATUS(status), 64);
}

}  // namespace
}  // namespace skein::vald
