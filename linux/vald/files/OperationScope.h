#pragma once

#include <string>

#include "linux/vald/files/OperationJournal.h"

namespace skein::vald {

struct FileRequest;

// One operation's entry in the journal, from begin() until it goes: an operation that
// returns early, with an error, is undone unless it said otherwise. One thread.
class OperationScope {
 public:
  OperationScope(OperationJournal& journal, OperationKind kind, const FileRequest& request,
                 std::string path, std::string destination, std::string aside = {});
  OperationScope(const OperationScope&) = delete;
  OperationScope& operator=(const OperationScope&) = delete;
  ~OperationScope();

  // The entry is on the disk. An error: change nothing.
  NSErrorPtr begin();
  // See OperationJournal.
  NSErrorPtr decide() { return _journal.decide(_entry.id); }
  const OperationEntry& entry() const { return _entry; }

  void done() { _outcome = Outcome::Done; }
  // It came to nothing and is tried again under another name.
  void discard() { _outcome = Outcome::Discard; }
  // Something is left to do that the next start does.
  void leaveOpen() { _outcome = Outcome::LeaveOpen; }

 private:
  enum class Outcome { Undone, Done, Discard, LeaveOpen };

  OperationJournal& _journal;
  OperationEntry _entry;
  Outcome _outcome = Outcome::Undone;
};

}  // namespace skein::vald
