#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "base/Completion.h"
#include "linux/vald/cloud/BoundedRunner.h"
#include "linux/vald/cloud/DownloadTransfer.h"

namespace skein::vald {

// Downloads documents, several at a time, each on a thread of its own; the others wait in
// the order in which they were asked for. A document that is asked for twice is fetched
// once, and both are answered. Any thread.
class Downloader {
 public:
  // `executor` has at least `limit` threads and serves nothing else: downloads block them.
  // `conditions` and `clock` outlive the downloader.
  Downloader(CloudPlaces places, CloudConditions& conditions, CloudClock& clock,
             std::shared_ptr<Executor> executor, std::size_t limit = 4);
  // Cancels what is not done, answers it, and waits until nothing runs. Not on a thread of
  // the executor's.
  ~Downloader();
  Downloader(const Downloader&) = delete;
  Downloader& operator=(const Downloader&) = delete;

  // One who asked. Letting it go changes nothing: the download goes on.
  class Ticket {
   public:
    virtual ~Ticket() = default;
    // Answers this one with NSUserCancelledError at once, unless it is answered already or
    // the file is just appearing. When nobody else waits for the document the download ends
    // too, and no part of it is left when the answer comes. Any thread.
    virtual void cancel() = 0;
  };

  struct Request {
    VLFileObjectID document = VLFileObjectID::documentWithRawID(0);
    std::string path;                     // absolute, the document's own
    bool isCopy = false;                  // the marker names another item than is at `path`
    DownloadTransfer::Progress progress;  // may be empty; on the download's thread
    // Null when the file is there. Once; on the download's thread, or the canceller's. It
    // must not let the downloader go. A progress may still be told meanwhile.
    Completion<NSErrorPtr> completion;
  };
  // Returns at once; never answers inside this call.
  std::shared_ptr<Ticket> download(Request request);

 private:
  struct Core;
  class WaiterTicket;

  // Tickets hold it too: they may outlive the downloader.
  const std::shared_ptr<Core> _core;
  BoundedRunner _runner;
};

}  // namespace skein::vald
