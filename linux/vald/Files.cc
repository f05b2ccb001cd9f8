// What changes where documents are.
#include "linux/vald/Files.h"

#include <cerrno>
#include <utility>

#include "linux/protocol/DocumentURL.h"
#include "linux/vald/cloud/CloudRecovery.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

constexpr unsigned kMostBounces = 10'000;

// Tells it how far a copy is, and the operation whether it was cancelled.
FileProgressHandler tellingTo(std::shared_ptr<NSProgress> progress) {
  return [progress = std::move(progress)](const FileProgress& state) {
    if (state.totalItems != 0) {
      progress->setTotalUnitCount(static_cast<std::int64_t>(state.totalBytes));
      progress->setCompletedUnitCount(static_cast<std::int64_t>(state.doneBytes));
    }
    return !progress->isCancelled();
  };
}

NSURLPtr urlOf(const std::string& path) {
  return path.empty() ? nullptr : NSURL::fileURLWithPath(path);
}

}  // namespace

Files::Subject Files::subjectAt(const NSURLPtr& url) {
  const StoreRoots& roots = _parts.operations.roots();
  Subject subject{findDocument(roots, url->path()), nullptr, std::nullopt, nullptr};
  const auto id = fileObjectIDOfDocumentURL(url);
  StorePlace there;
  bool mayMove = true;  // roots and their trashes stay, and are no items of a folder
  if (!roots.locate(url->path(), there)) {
    const auto trashed = trashedPath(there.relative);
    mayMove = !there.isRoot() && !(trashed && trashed->name.empty());
  }
  if (!id || !mayMove) {
    subject.item = _parts.store.itemAtPath(subject.place.path, false, nullptr);
    return subject;
  }
  if (recognize(subject, *id)) return subject;
  // What happened a moment ago may be unknown yet: the file was saved, or has moved.
  _parts.store.catchUp(subject.place.path);
  subject.place = findDocument(roots, url->path());
  if (recognize(subject, *id)) return subject;
  const bool isTaken =
      !roots.locate(subject.place.physical, there) && there.folder.exists(there.name);
  subject.error = fileError(isTaken ? ESTALE : ENOENT, "can't find", subject.place.path);
  return subject;
}

NSErrorPtr Files::willLeave(const Subject& subject) const {
  if (subject.place.isEvicted() || !subject.item ||
      subject.item->fileObjectID().isFolderOrAliasID()) {
    return nullptr;
  }
  return nameOlderVersionApart(_parts.places, subject.place.path, subject.item->fileObjectID());
}

bool Files::recognize(Subject& subject, VLFileObjectID id) {
  const auto known = _parts.store.knownItem(id);
  StorePlace there;
  FileKey file;
  if (!known || known->path != subject.place.path ||
      _parts.operations.roots().locate(subject.place.physical, there) ||
      readFileKey(there.folder.get(), there.name, file) != 0 || !known->file.names(file)) {
    return false;
  }
  subject.item = known->item;
  subject.file = file;
  return true;
}

void Files::lookAgainAfter(const NSErrorPtr& error, const Subject& subject) {
  if (error && error->code() == NSFileNoSuchFileError) _parts.store.catchUp(subject.place.path);
}

FileRequest Files::request(const Subject& subject, RequestOrigin origin) const {
  FileRequest request;
  request.origin = std::move(origin);
  if (subject.item) request.document = subject.item->fileObjectID().asString();
  request.file = subject.file;
  return request;
}

void Files::answerResult(URLReply& reply, const FileResult& result,
                         std::vector<std::string> touched) {
  std::string path;
  if (!result.error) {
    path = documentPath(&_parts.operations.roots(), result.path);
    touched.push_back(path);
    _parts.store.lookAtPaths(touched);
  }
  reply(urlOf(path), result.error);
}

// ---- something new

std::shared_ptr<NSProgress> Files::importDocument(NSURLPtr source, NSURLPtr folder,
                                                  std::optional<std::string> name,
                                                  RequestOrigin origin, URLReply reply) {
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  NSErrorPtr error;
  if (!source) error = vlc_errorInvalidParameter("source", "(null)");
  if (!folder) error = vlc_errorInvalidParameter("folder", "(null)");
  postAnswer(*_parts.importExecutor, std::move(reply), [=, this](URLReply& answered) {
    if (error) return answerError(answered, error);
    FileRequest request;
    request.origin = origin;
    request.progress = tellingTo(progress);
    answerResult(answered,
                 _parts.operations.importDocument(source->path(), folder->path(), name, request),
                 {});
  });
  return progress;
}

void Files::createFolder(NSURLPtr folder, std::string name, RequestOrigin origin, URLReply reply) {
  answer("folder", folder, std::move(reply), [=, this](URLReply& answered) {
    answerResult(answered, _parts.operations.createFolder(folder->path(), name, {origin, {}, {}}),
                 {});
  });
}

void Files::makeAlias(NSURLPtr folder, std::string name, std::string target, RequestOrigin origin,
                      URLReply reply) {
  answer("folder", folder, std::move(reply), [=, this](URLReply& answered) {
    answerResult(answered,
                 _parts.operations.makeAlias(folder->path(), name, target, {origin, {}, {}}), {});
  });
}

// ---- another place

NSErrorPtr Files::refusalOfMarkerName(const Subject& subject, const std::string& name) const {
  if (NSErrorPtr refusal = refusalOfName(name, false)) return refusal;
  if (!MarkerNames(name).shortened || name == nameOfPath(subject.place.path)) return nullptr;
  return fileErrorWithWords(NSFileWriteInvalidFileNameError, ENAMETOOLONG,
                            "a document that is not present can't have a name this long; "
                            "download it first",
                            subject.place.path);
}

FileResult Files::renameEvicted(const Subject& subject, const std::string& newName,
                                const FileRequest& request) {
  if (NSErrorPtr refusal = refusalOfMarkerName(subject, newName)) return {{}, refusal};
  const std::string newPath = joinPath(parentOfPath(subject.place.path), newName);
  FileResult result =
      _parts.operations.rename(subject.place.physical, MarkerNames(newName).marker, request);
  if (result.error && result.error->code() == NSFileWriteFileExistsError) {
    result.error = fileError(EEXIST, "can't rename", newPath);
  }
  return result;
}

FileResult Files::moveEvicted(const Subject& subject, const std::string& folder,
                              const std::optional<std::string>& newName, bool bounce,
                              const FileRequest& request) {
  std::string name = newName.value_or(nameOfPath(subject.place.path));
  // In the trash it may have had to be called otherwise.
  const FileResult before = _parts.operations.putBackPath(subject.place.physical);
  if (!newName && !before.error) name = nameOfPath(documentPath(nullptr, before.path));
  if (NSErrorPtr refusal = refusalOfMarkerName(subject, name)) return {{}, refusal};
  FileResult result;
  for (unsigned number = 1; number <= (bounce ? kMostBounces : 1); ++number) {
    const std::string candidate = numberedName(name, number, ' ');
    result = _parts.operations.move(subject.place.physical, folder, MarkerNames(candidate).marker,
                                    false, request);
    if (!result.error || result.error->code() != NSFileWriteFileExistsError) return result;
    result.error = fileError(EEXIST, "can't move it to", joinPath(folder, candidate));
  }
  return result;
}

void Files::answerMove(URLReply& reply, const Subject& subject, RequestOrigin origin,
                       const std::function<FileResult(const FileRequest&)>& move) {
  std::vector<std::string> places{subject.place.path};
  std::function<void()> waitForStore;
  std::optional<StoreWriter::Copy> copy;
  bool isTaken = false;
  FileRequest asked = request(subject, std::move(origin));
  asked.leaves = [&](const std::string& path) {
    if (copy) _parts.store.forgetCopy(*copy);  // it is tried again under another name
    places.push_back(documentPath(nullptr, path));
    copy = _parts.store.expectCopy(places.front(), places.back());
  };
  asked.moved = [&](const std::string& path, bool isCopy) {
    if (isCopy) {
      isTaken = copy && _parts.store.takeCopy(*copy);
      return;
    }
    places.push_back(documentPath(&_parts.operations.roots(), path));
    waitForStore = _parts.store.beginLookAtPaths(places);
  };
  const FileResult result = move(asked);
  if (copy && !isTaken) {
    _parts.store.forgetCopy(*copy);
    _parts.store.lookAtPaths(places);
  }
  if (isTaken && !result.error) return reply(urlOf(places.back()), nullptr);
  if (waitForStore) {
    waitForStore();
    if (!result.error) return reply(urlOf(places.back()), nullptr);
    // It was taken back.
    lookAgainAfter(result.error, subject);
    _parts.store.lookAtPaths(places);
  } else {
    lookAgainAfter(result.error, subject);
  }
  answerResult(reply, result, std::move(places));
}

void Files::rename(NSURLPtr url, std::string newName, RequestOrigin origin, URLReply reply) {
  answer("url", url, std::move(reply), [=, this](URLReply& answered) {
    const Subject subject = subjectAt(url);
    if (subject.error) return answerError(answered, subject.error);
    if (NSErrorPtr error = willLeave(subject)) return answerError(answered, error);
    answerMove(answered, subject, origin, [&](const FileRequest& asked) {
      return subject.place.isEvicted()
                 ? renameEvicted(subject, newName, asked)
                 : _parts.operations.rename(subject.place.path, newName, asked);
    });
  });
}

std::shared_ptr<NSProgress> Files::move(NSURLPtr url, NSURLPtr folder,
                                        std::optional<std::string> newName, bool bounce,
                                        RequestOrigin origin, URLReply reply) {
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  const auto moveNow = [=, this](URLReply& answered) {
    const Subject subject = subjectAt(url);
    if (subject.error) return answerError(answered, subject.error);
    if (NSErrorPtr error = willLeave(subject)) return answerError(answered, error);
    answerMove(answered, subject, origin, [&](FileRequest asked) {
      asked.progress = tellingTo(progress);
      return subject.place.isEvicted()
                 ? moveEvicted(subject, folder->path(), newName, bounce, asked)
                 : _parts.operations.move(subject.place.path, folder->path(), newName, bounce,
                                          asked);
    });
  };
  answer("url", folder ? url : nullptr, std::move(reply), [=, this](URLReply& answered) {
    if (!_parts.operations.crossesVolumes(url->path(), folder->path())) return moveNow(answered);
    postAnswer(*_parts.importExecutor, std::move(answered), moveNow);
  });
  return progress;
}

std::shared_ptr<NSProgress> Files::remove(NSURLPtr url, RequestOrigin origin,
                                          Reply<NSErrorPtr> reply) {
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  answer("url", url, std::move(reply), [=, this](Reply<NSErrorPtr>& answered) {
    const Subject subject = subjectAt(url);
    if (subject.error) return answered(subject.error);
    if (NSErrorPtr error = willLeave(subject)) return answered(error);
    FileRequest asked = request(subject, origin);
    const auto goesOn = [&] { return !progress->isCancelled(); };
    Task deletion;
    asked.progress = [&](const FileProgress&) { return goesOn(); };
    asked.removed = [&] {
      _parts.store.lookAtPaths({subject.place.path});
      return goesOn();
    };
    asked.deleteLater = [&](Task task) { deletion = std::move(task); };
    const FileResult result = _parts.operations.remove(subject.place.physical, asked);
    if (result.error) {
      // It may have been put back.
      std::vector<std::string> places{subject.place.path};
      if (!result.path.empty()) {
        places.push_back(documentPath(&_parts.operations.roots(), result.path));
      }
      lookAgainAfter(result.error, subject);
      _parts.store.lookAtPaths(places);
    }
    answered(result.error);
    if (deletion) _parts.importExecutor->post(std::move(deletion));
  });
  return progress;
}

void Files::trash(NSURLPtr url, RequestOrigin origin, URLReply reply) {
  answer("url", url, std::move(reply), [=, this](URLReply& answered) {
    const Subject subject = subjectAt(url);
    if (subject.error) return answerError(answered, subject.error);
    if (NSErrorPtr error = willLeave(subject)) return answerError(answered, error);
    const FileResult result =
        _parts.operations.trash(subject.place.physical, request(subject, origin));
    lookAgainAfter(result.error, subject);
    answerResult(answered, result, {subject.place.path});
  });
}

// ---- questions about places

void Files::putBackURL(NSURLPtr url, URLReply reply) {
  answer("url", url, std::move(reply), [=, this](URLReply& answered) {
    const DocumentPlace place = findDocument(_parts.operations.roots(), url->path());
    FileResult result = _parts.operations.putBackPath(place.physical);
    if (place.isEvicted()) result.path = documentPath(nullptr, result.path);
    answered(urlOf(result.path), result.error);
  });
}

void Files::capabilityToMove(NSURLPtr url, NSURLPtr toURL, Reply<std::uint64_t, NSErrorPtr> reply) {
  answer("url", toURL ? url : nullptr, std::move(reply), [=, this](auto& answered) {
    const DocumentPlace place = findDocument(_parts.operations.roots(), url->path());
    NSErrorPtr error;
    const std::uint64_t capability =
        _parts.operations.capabilityToMove(place.physical, toURL->path(), &error);
    answered(capability, error);
  });
}

void Files::coordinateDeletion(NSURLPtr url, URLReply reply) {
  answer("url", url, std::move(reply), [=, this](URLReply& answered) {
    const Subject subject = subjectAt(url);
    NSErrorPtr error = _parts.operations.waitFor(subject.place.physical);
    std::string path = subject.place.path;
    auto id = fileObjectIDOfDocumentURL(url);
    if (!id && subject.item) id = subject.item->fileObjectID();
    // What it waited for may have moved the item.
    if (error && error->code() == NSFileNoSuchFileError && id) {
      const auto now = _parts.store.pathForID(*id, nullptr);
      if (now && *now != path) {
        path = *now;
        error = nullptr;
      }
    } else if (!error) {
      error = subject.error;
    }
    answered(error ? nullptr : urlOf(path), error);
  });
}

void Files::physicalURL(NSURLPtr url, Reply<NSURLPtr, bool, NSErrorPtr> reply) {
  answer("url", url, std::move(reply), [=, this](auto& answered) {
    const DocumentPlace place = findDocument(_parts.operations.roots(), url->path());
    StorePlace there;
    NSErrorPtr error = _parts.operations.roots().locate(place.physical, there);
    if (!error && !there.isRoot() && !there.folder.exists(there.name)) {
      error = fileError(ENOENT, "can't find", place.path);
    }
    answered(error ? nullptr : urlOf(place.physical), place.namedByMarker, error);
  });
}

}  // namespace skein::vald
