// The services of a drive's items, for any program: link skein_linux_client, include this.
//
//   NSErrorPtr error;
//   const auto services = SkeinServices::open("/home/me/Documents", &error);
//   const auto sharing = services->sharing("/letter.txt", &error);
//   const auto [share, problem] = awaitReply<CKSharePtr>([&](auto reply) {
//     return sharing->fetchShareWithCompletion(std::move(reply));
//   });
//
// What a service can do stands in vellum/VLSharingServiceV1.h and
// vellum/VLFileProviderQuireCollaboration.h. Any thread, unless a function says otherwise.
#pragma once

#include <future>
#include <memory>
#include <string>
#include <tuple>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/foundation/NSError.h"
#include "vellum/VLFileProviderQuireCollaboration.h"
#include "vellum/VLSharingServiceV1.h"

namespace skein {

// A connection to one service of one item, of type VLSharingServiceV1 or
// VLFileProviderQuireCollaboration; it can neither see nor change anything of another item.
// It is used like a pointer to the service, and closed when this goes: requests under way
// are cancelled then, and answer. Replies come on a thread of this library, from where
// further requests may be made. When skein-host is lost, requests answer
// VLVellumErrorDaemonUnreachable, and a new connection has to be asked for.
template <class Service>
class ServiceHandle {
 public:
  ServiceHandle() = default;
  ServiceHandle(std::shared_ptr<Service> service, UniqueFunction<void()> close)
      : _service(std::move(service)), _close(std::move(close)) {}
  ServiceHandle(ServiceHandle&&) noexcept = default;
  ServiceHandle& operator=(ServiceHandle&& other) noexcept {
    close();
    _service = std::move(other._service);
    _close = std::move(other._close);
    return *this;
  }
  ~ServiceHandle() { close(); }

  // False when there is no connection: the item or its service could not be reached.
  explicit operator bool() const { return _service != nullptr; }
  Service* operator->() const { return _service.get(); }
  void close() {
    if (_close) std::exchange(_close, nullptr)();
    _service = nullptr;
  }

 private:
  std::shared_ptr<Service> _service;
  UniqueFunction<void()> _close;
};

// A drive's services. The drive's programs are started when they do not run.
class SkeinServices {
 public:
  // `store`: the drive's folder. Null with an error that says what to do when there is no
  // such folder. Nothing is sent before something is asked.
  static std::unique_ptr<SkeinServices> open(const std::string& store, NSErrorOut error);
  virtual ~SkeinServices() = default;

  // The three below wait for the answer: any thread but those that replies come on. `item`
  // is a path from the drive's root, as "/Reports/letter.txt", or an item identifier. Their
  // errors: NSFileProviderErrorDomain for an item that is not there and when nobody is
  // logged in, NSFeatureUnsupportedError for a service that the item does not offer,
  // VLVellumErrorDaemonUnreachable.

  // The names of the services that an item offers; perhaps none.
  virtual std::vector<std::string> serviceNames(const std::string& item, NSErrorOut error) = 0;
  // "com.tessel.Vellum.SharingV1"
  virtual ServiceHandle<VLSharingServiceV1> sharing(const std::string& item, NSErrorOut error) = 0;
  // "com.tessel.QuireCollaboration"
  virtual ServiceHandle<VLFileProviderQuireCollaboration> collaboration(const std::string& item,
                                                                        NSErrorOut error) = 0;
};

// Makes a request and waits for its reply: start(reply) calls a service's method with the
// reply, and may answer its progress, which then goes to `progressed`, if given, before the
// wait: to be kept, and cancelled from another thread. Any thread but those that replies
// come on.
template <class... Values, class Start, class Progressed>
std::tuple<Values..., NSErrorPtr> awaitReply(Start start, Progressed progressed) {
  using Answer = std::tuple<Values..., NSErrorPtr>;
  std::promise<Answer> promise;
  auto answer = promise.get_future();
  Completion<Values..., NSErrorPtr> reply(
      [promise = std::move(promise)](Values... values, NSErrorPtr error) mutable {
        promise.set_value(Answer(std::move(values)..., std::move(error)));
      });
  if constexpr (std::is_void_v<std::invoke_result_t<Start&, decltype(reply)>>) {
    start(std::move(reply));
  } else {
    progressed(start(std::move(reply)));
  }
  return answer.get();
}
template <class... Values, class Start>
std::tuple<Values..., NSErrorPtr> awaitReply(Start start) {
  std::shared_ptr<NSProgress> kept;
  return awaitReply<Values...>(std::move(start),
                               [&](auto progress) { kept = std::move(progress); });
}

}  // namespace skein
