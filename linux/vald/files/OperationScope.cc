#include "linux/vald/files/OperationScope.h"

#include <utility>

#include "linux/vald/files/FileOperations.h"

namespace skein::vald {

OperationScope::OperationScope(OperationJournal& journal, OperationKind kind,
                               const FileRequest& request, std::string path,
                               std::string destination, std::string aside)
    : _journal(journal) {
  _entry.kind = kind;
  _entry.origin = request.origin;
  _entry.document = request.document;
  _entry.path = std::move(path);
  _entry.destination = std::move(destination);
  _entry.aside = std::move(aside);
}

NSErrorPtr OperationScope::begin() { return _journal.begin(_entry); }

OperationScope::~OperationScope() {
  if (_entry.id == 0 || _outcome == Outcome::LeaveOpen) return;
  if (_outcome == Outcome::Discard) {
    _journal.discard(_entry.id);
  } else {
    _journal.end(_entry.id,
                 _outcome == Outcome::Done ? OperationState::Done : OperationState::Undone);
  }
}

}  // namespace skein::vald
