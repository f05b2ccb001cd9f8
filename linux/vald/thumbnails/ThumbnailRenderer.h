#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>

#include "base/Completion.h"
#include "base/Executor.h"
#include "linux/vald/cloud/BoundedRunner.h"
#include "linux/vald/cloud/CloudClock.h"
#include "linux/vald/thumbnails/RenderWorker.h"
#include "platform/log/Log.h"

namespace skein::vald {

// Draws documents in worker processes: as many at a time as there are cores, the others wait
// in order. A process is started when one is needed, replaced when a document ended it, and
// ended when nothing was asked for a while. Any thread.
class ThumbnailRenderer {
 public:
  struct Options {
    RenderWorker::Options worker;
    std::size_t limit = std::thread::hardware_concurrency();
    CloudClock::Duration idle = std::chrono::seconds(20);
  };

  // `executor` has at least `limit` threads for this: drawing blocks them. `clock` and `log`
  // outlive the renderer.
  ThumbnailRenderer(Options options, std::shared_ptr<Executor> executor, CloudClock& clock,
                    Log& log);
  // Cancels what is not done, answers it, and ends the processes. Not on a thread of the
  // executor's.
  ~ThumbnailRenderer();
  ThumbnailRenderer(const ThumbnailRenderer&) = delete;
  ThumbnailRenderer& operator=(const ThumbnailRenderer&) = delete;

  // One who asked. Letting it go changes nothing.
  class Ticket {
   public:
    virtual ~Ticket() = default;
    // NSUserCancelledError, unless the request is answered: at once where it still waited,
    // else when its process has been ended. Any thread.
    virtual void cancel() = 0;
  };

  struct Request {
    PictureKind kind = PictureKind::Jpeg;
    PictureFormat format = PictureFormat::Any;  // or Png
    std::uint32_t side = kLargestSide;          // 1 to kLargestSide
    FileDescriptor document;                    // open for reading; drawn from its start
    // A picture, or an error of SkeinRenderErrorDomain. Once; on a thread of the executor's,
    // or the canceller's. It must not let the renderer go.
    Completion<Outcome<RenderedPicture>> completion;
  };
  // Returns at once; never answers inside this call.
  std::shared_ptr<Ticket> render(Request request);

  // Why the last process that was needed did not start; empty when it did, or none was.
  std::string startProblem() const;

  // The processes that live at the moment.
  std::size_t workers() const;

 private:
  struct Core;
  class RequestTicket;

  // Tickets and timers hold it too: they may outlive the renderer.
  const std::shared_ptr<Core> _core;
  BoundedRunner _runner;
};

}  // namespace skein::vald
