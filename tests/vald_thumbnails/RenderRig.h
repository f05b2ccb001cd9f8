// A renderer over real worker processes, and what it answered.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "base/ThreadPool.h"
#include "linux/vald/thumbnails/RenderErrors.h"
#include "linux/vald/thumbnails/ThumbnailRenderer.h"
#include "tests/protocol/Waiting.h"
#include "tests/vald_cloud/CloudRig.h"
#include "tests/vald_thumbnails/SamplePictures.h"

namespace skein::vald {

inline RenderWorker::Options workerOptions() {
  RenderWorker::Options options;
  options.program = SKEIN_BIN_DIR "/skein-thumbnailer";
  options.keepsStandardError = true;           // a sanitizer's report is to be seen
  options.patience = std::chrono::minutes(2);  // tests may run on a busy machine
  return options;
}

// Nobody reads it.
class SilentLog final : public Log {
 public:
  void write(LogType, std::string_view) override {}
};

inline std::string failureOf(const NSErrorPtr& error) {
  return error == nullptr ? "none" : error->domain() + " " + std::to_string(error->code());
}
inline std::string failureText(RenderFailure failure) {
  std::string text = SkeinRenderErrorDomain;
  text += ' ';
  return text + std::to_string(static_cast<std::int64_t>(failure));
}

struct RenderRig {
  explicit RenderRig(ThumbnailRenderer::Options options = withLimit(2)) : limits(options) {
    renderer = std::make_unique<ThumbnailRenderer>(options, pool, clock, log);
  }
  static ThumbnailRenderer::Options withLimit(std::size_t limit) {
    ThumbnailRenderer::Options options;
    options.worker = workerOptions();
    options.limit = limit;
    return options;
  }

  std::shared_ptr<ThumbnailRenderer::Ticket> ask(PictureKind kind, const std::string& document) {
    ThumbnailRenderer::Request request;
    request.kind = kind;
    request.document = samples::fileWith(document);
    request.completion = [this](Outcome<RenderedPicture> picture) {
      answers.add(failureOf(picture.error()));
    };
    return renderer->render(std::move(request));
  }
  std::string answer() { return answers.take().value_or("nothing by the deadline"); }

  ThumbnailRenderer::Options limits;
  SilentLog log;
  ManualClock clock;
  Inbox<std::string> answers;
  std::shared_ptr<ThreadPool> pool = std::make_shared<ThreadPool>(4, "render");
  std::unique_ptr<ThumbnailRenderer> renderer;
};

}  // namespace skein::vald
