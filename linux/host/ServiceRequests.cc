#include "linux/host/ServiceRequests.h"

#include <utility>

#include "linux/host/Deadline.h"
#include "linux/host/LocalListeners.h"
#include "platform/fileprovider/NSFileProviderError.h"

namespace skein {
namespace {

// The exported object, as a client of one item meets it.
class ItemsSharing final : public VLSharingServiceV1 {
 public:
  ItemsSharing(std::shared_ptr<VLSharingServiceV1> inner, std::string identifier)
      : _inner(std::move(inner)), _identifier(std::move(identifier)) {}

  void fetchSharingInfo(Completion<bool, NSFileProviderItemPtr, NSErrorPtr> reply) override {
    _inner->fetchSharingInfo(std::move(reply));
  }
  Progress preflightCheckIfCurrentlyShareableWithCompletion(
      Completion<bool, NSFileProviderItemPtr, Items, Items, NSErrorPtr> completion) override {
    return _inner->preflightCheckIfCurrentlyShareableWithCompletion(std::move(completion));
  }
  Progress fetchParticipantListAndPublicPermission(
      Completion<Participants, std::int64_t, NSErrorPtr> reply) override {
    return _inner->fetchParticipantListAndPublicPermission(std::move(reply));
  }
  void startPreparingForShareWhenForcing(bool forcing) override {
    _inner->startPreparingForShareWhenForcing(forcing);
  }
  Progress fetchShareWithCompletion(Completion<CKSharePtr, NSErrorPtr> completion) override {
    return _inner->fetchShareWithCompletion(std::move(completion));
  }
  Progress fetchShareURLWithCompletion(Completion<NSURLPtr, NSErrorPtr> completion) override {
    return _inner->fetchShareURLWithCompletion(std::move(completion));
  }
  Progress saveShare(CKSharePtr share, Completion<CKSharePtr, NSErrorPtr> completion) override {
    if (!share) return _inner->saveShare(nullptr, std::move(completion));
    CKShare own = *share;
    own.rootRecordName = _identifier;
    return _inner->saveShare(std::make_shared<const CKShare>(std::move(own)),
                             std::move(completion));
  }
  Progress unshareWithCompletion(Completion<NSErrorPtr> completion) override {
    return _inner->unshareWithCompletion(std::move(completion));
  }

 private:
  const std::shared_ptr<VLSharingServiceV1> _inner;
  const std::string _identifier;
};

class ItemsConnection final : public ServiceConnection {
 public:
  ItemsConnection(std::shared_ptr<ServiceConnection> inner, std::string identifier)
      : _inner(std::move(inner)), _identifier(std::move(identifier)) {}

  std::shared_ptr<VLSharingServiceV1> sharing() override {
    auto exported = _inner->sharing();
    if (!exported) return nullptr;
    return std::make_shared<ItemsSharing>(std::move(exported), _identifier);
  }
  std::shared_ptr<VLFileProviderQuireCollaboration> collaboration() override {
    return _inner->collaboration();
  }
  void close() override { _inner->close(); }

 private:
  const std::shared_ptr<ServiceConnection> _inner;
  const std::string _identifier;
};

class ItemsEndpoint final : public ServiceEndpoint {
 public:
  ItemsEndpoint(std::shared_ptr<ServiceEndpoint> inner,
                std::shared_ptr<NSFileProviderServiceSource> source, std::string identifier)
      : _inner(std::move(inner)), _source(std::move(source)), _identifier(std::move(identifier)) {}

  void connect(Reply<std::shared_ptr<ServiceConnection>, NSErrorPtr> reply) override {
    _inner->connect([identifier = _identifier, reply = std::move(reply)](
                        std::shared_ptr<ServiceConnection> connection, NSErrorPtr error) mutable {
      if (connection) {
        connection = std::make_shared<ItemsConnection>(std::move(connection), identifier);
      }
      reply(std::move(connection), std::move(error));
    });
  }

 private:
  const std::shared_ptr<ServiceEndpoint> _inner;
  const std::shared_ptr<NSFileProviderServiceSource> _source;
  const std::string _identifier;
};

NSErrorPtr notOffered(const std::string& serviceName, const NSFileProviderServiceSources& sources) {
  std::string text = "This item does not offer the service " + serviceName + "; it offers ";
  if (sources.empty()) text += "none";
  for (std::size_t i = 0; i < sources.size(); ++i) {
    text += (i > 0 ? " and " : "") + sources[i]->serviceName();
  }
  return NSError::errorWithDomain(NSCocoaErrorDomain, NSFeatureUnsupportedError,
                                  {{NSLocalizedDescriptionKey, text + "."}});
}

}  // namespace

void ServiceRequests::findSources(HostTarget target,
                                  Reply<std::string, Sources, NSErrorPtr> reply) {
  auto timed = TimedReply<std::string, Sources>::begin(_host->tools(), std::move(reply));
  _findIdentifier(std::move(target), [self = shared_from_this(), timed](
                                         const std::string& identifier, NSErrorPtr error) {
    NSFileProviderExtension& extension = self->_host->extension();
    Sources sources;
    // The lookup says whether the item is there and whether anybody is logged in.
    if (!error && extension.itemForIdentifier(identifier, &error)) {
      sources = extension.supportedServiceSourcesForItemIdentifier(identifier, &error);
    } else if (!error) {
      error = fileProviderErrorForNonExistentItemWithIdentifier(identifier);
    }
    (*timed)(identifier, std::move(sources), std::move(error));
  });
}

void ServiceRequests::serviceSources(HostTarget target,
                                     Reply<std::vector<std::string>, NSErrorPtr> reply) {
  findSources(std::move(target),
              [reply = std::move(reply)](const std::string& /*identifier*/, const Sources& sources,
                                         NSErrorPtr error) mutable {
                std::vector<std::string> names;
                for (const auto& source : sources) names.push_back(source->serviceName());
                reply(std::move(names), std::move(error));
              });
}

void ServiceRequests::endpoint(HostTarget target, std::string serviceName,
                               Reply<std::shared_ptr<ServiceEndpoint>, NSErrorPtr> reply) {
  findSources(std::move(target),
              [serviceName = std::move(serviceName), reply = std::move(reply)](
                  const std::string& identifier, const Sources& sources, NSErrorPtr error) mutable {
                std::shared_ptr<ServiceEndpoint> endpoint;
                for (const auto& source : sources) {
                  if (source->serviceName() != serviceName) continue;
                  auto made = serviceEndpoint(source->makeListenerEndpointAndReturnError(&error));
                  if (made) endpoint = std::make_shared<ItemsEndpoint>(made, source, identifier);
                  break;
                }
                if (!endpoint && !error) error = notOffered(serviceName, sources);
                reply(std::move(endpoint), std::move(error));
              });
}

}  // namespace skein
