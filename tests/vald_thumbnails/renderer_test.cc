// The pool of workers: one answer per request, whatever becomes of the processes.
#include <csignal>
#include <filesystem>

#include "tests/vald_thumbnails/RenderRig.h"

namespace skein::vald {
namespace {

const std::string& good() {
  static const std::string picture = samples::picture(PictureKind::Png);
  return picture;
}

TEST(RendererTest, AWorkerThatADocumentEndedIsReplaced) {
  auto options = RenderRig::withLimit(1);
  options.worker.patience = std::chrono::seconds(2);
  RenderRig rig(options);
  rig.ask(PictureKind::Png, good());
  rig.ask(PictureKind::Pdf, samples::slowPdf(9));
  rig.ask(PictureKind::Png, good());
  EXPECT_EQ(rig.answer(), "none");
  EXPECT_EQ(rig.answer(), failureText(RenderFailure::NotInTime));
  EXPECT_EQ(rig.answer(), "none");
  EXPECT_TRUE(becomesTrue([&] { return rig.renderer->workers() == 1; }));
}

TEST(RendererTest, WorkersStartOnDemandUpToTheLimitAndEndWhenIdle) {
  RenderRig rig;
  EXPECT_EQ(rig.renderer->workers(), 0u);
  for (int number = 0; number < 8; ++number) rig.ask(PictureKind::Png, good());
  for (int number = 0; number < 8; ++number) EXPECT_EQ(rig.answer(), "none");
  EXPECT_GE(rig.renderer->workers(), 1u);
  EXPECT_LE(rig.renderer->workers(), 2u);
  // The timer is set when the last of them has come back.
  EXPECT_TRUE(becomesTrue([&] {
    rig.clock.advance(rig.limits.idle);
    return rig.renderer->workers() == 0;
  }));
  rig.ask(PictureKind::Png, good());
  EXPECT_EQ(rig.answer(), "none");
}

TEST(RendererTest, CancelAnswersAtOnceWhatWaitsAndEndsWhatRuns) {
  RenderRig rig(RenderRig::withLimit(1));
  const auto running = rig.ask(PictureKind::Pdf, samples::slowPdf(9));
  const auto waiting = rig.ask(PictureKind::Png, good());
  waiting->cancel();
  EXPECT_EQ(rig.answer(), "NSCocoaErrorDomain 3072");
  running->cancel();
  EXPECT_EQ(rig.answer(), "NSCocoaErrorDomain 3072");
  rig.ask(PictureKind::Png, good());
  EXPECT_EQ(rig.answer(), "none");
  running->cancel();
  EXPECT_EQ(rig.answers.count(), 0u);
}

TEST(RendererTest, EveryRequestIsAnsweredWhenTheRendererGoes) {
  RenderRig rig(RenderRig::withLimit(1));
  rig.ask(PictureKind::Pdf, samples::slowPdf(9));
  rig.ask(PictureKind::Pdf, samples::slowPdf(9));
  rig.ask(PictureKind::Png, good());
  rig.renderer.reset();
  ASSERT_EQ(rig.answers.count(), 3u);
  for (int number = 0; number < 3; ++number) EXPECT_EQ(rig.answer(), "NSCocoaErrorDomain 3072");
}

TEST(RendererTest, AProgramThatIsMissingOrIsAnotherIsAnErrorOfTheMachine) {
  for (const char* program : {"/nowhere/skein-thumbnailer", "/bin/true"}) {
    auto options = RenderRig::withLimit(1);
    options.worker.program = program;
    RenderRig rig(options);
    rig.ask(PictureKind::Png, good());
    EXPECT_EQ(rig.answer(), failureText(RenderFailure::WorkerNotStarted));
    EXPECT_EQ(rig.renderer->workers(), 0u);
  }
}

// One that died while it had nothing to do says nothing about the next document.
TEST(RendererTest, AWorkerThatWasKilledWhileIdleIsNotUsed) {
  auto worker = RenderWorker::start(workerOptions());
  ASSERT_TRUE(worker);
  EXPECT_TRUE((*worker)->isUsable());
  kill((*worker)->processID(), SIGKILL);
  EXPECT_TRUE(becomesTrue([&] { return !(*worker)->isUsable(); }));
  Cancellation cancellation;
  const FileDescriptor document = samples::fileWith(good());
  const auto drawn =
      (*worker)->render({PictureKind::Png, PictureFormat::Any, 64, document.get()}, cancellation);
  EXPECT_EQ(failureOf(drawn.error()), failureText(RenderFailure::EndedWorker));
}

}  // namespace
}  // namespace skein::vald
