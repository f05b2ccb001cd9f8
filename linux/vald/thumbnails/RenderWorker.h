#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "base/Mutex.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/rendering/RenderMessages.h"
#include "linux/vald/cloud/Cancellation.h"
#include "linux/vald/cloud/Outcome.h"

namespace skein {
struct Packet;
}  // namespace skein

namespace skein::vald {

struct RenderedPicture {
  PictureFormat format = PictureFormat::Any;  // Jpeg or Png
  std::uint32_t width = 0;
  std::uint32_t height = 0;
  std::string bytes;
};

// One process that draws documents, one at a time, and can do nothing else (see
// linux/thumbnailer/). What a document does to it is this object's to find out: it never
// waits longer than the limits say. One thread at a time, except where it says otherwise.
class RenderWorker : public std::enable_shared_from_this<RenderWorker> {
 public:
  struct Options {
    std::string program;  // skein-thumbnailer's file; empty: beside the running program
    std::chrono::seconds processorTime{10};      // for one document
    std::chrono::milliseconds patience{60'000};  // by the clock on the wall, for one document
    std::chrono::milliseconds patienceAtStart{10'000};
    bool keepsStandardError = false;  // for tests: else what it says goes nowhere
  };

  // Starts one and waits until it is locked down. WorkerNotStarted otherwise. Blocks.
  static Outcome<std::shared_ptr<RenderWorker>> start(Options options);
  // Ends the process.
  ~RenderWorker();
  RenderWorker(const RenderWorker&) = delete;
  RenderWorker& operator=(const RenderWorker&) = delete;

  struct Job {
    PictureKind kind = PictureKind::Jpeg;
    PictureFormat format = PictureFormat::Any;  // or Png
    std::uint32_t side = kLargestSide;          // 1 to kLargestSide
    int document = -1;                          // open for reading; from its start
  };
  // Blocks until there is a picture, or the reason why not; SkeinRenderErrorDomain, or
  // NSUserCancelledError. A cancellation ends the process. After an error that ended the
  // process isUsable() is false.
  Outcome<RenderedPicture> render(const Job& job, Cancellation& cancellation);

  // Whether it may be given another document: it lives, and has not served for too long.
  bool isUsable();
  const Greeting& greeting() const { return _greeting; }
  pid_t processID() const { return _process; }

 private:
  RenderWorker(Options options, pid_t process, FileDescriptor socket)
      : _options(std::move(options)), _process(process), _socket(std::move(socket)) {}

  NSErrorPtr awaitGreeting();
  void limitProcessorTime();
  // Waits for the answer. 0, or the errno; ETIMEDOUT.
  int await(std::chrono::milliseconds patience, Packet& packet);
  // Ends the process if it still serves the job of this number. Any thread.
  void interrupt(std::uint64_t job) SKEIN_EXCLUDES(_mutex);
  // Ends and reaps the process; answers how it had ended when it ended by itself.
  int end() SKEIN_EXCLUDES(_mutex);
  NSErrorPtr endingError(int status) const;

  const Options _options;
  const pid_t _process;
  const FileDescriptor _socket;
  Greeting _greeting;

  Mutex _mutex;
  std::uint64_t _job SKEIN_GUARDED_BY(_mutex) = 0;  // odd while one runs
  bool _reaped SKEIN_GUARDED_BY(_mutex) = false;
};

}  // namespace skein::vald
