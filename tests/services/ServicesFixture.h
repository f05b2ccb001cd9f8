#pragma once

#include <gtest/gtest.h>

#include "extension/VLFileProviderExtension.h"
#include "services/VLFileProviderQuireCollaborationProxy.h"
#include "services/VLSharingProxy.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"

namespace skein {

// The principal object over a store with a document at /store/a and a folder at /store/f,
// asked for services as a host does, with connections that a test makes.
struct ServicesFixture : testing::Test {
  ServicesFixture() {
    framework.documents.urls = {{VLFileObjectID::documentWithRawID(1), storeURL("/a")},
                                {VLFileObjectID::folderOrAliasWithRawID(7), storeURL("/f")}};
    env.run();
  }

  // What a test left unanswered answers while what hears it is still there.
  void TearDown() override {
    framework.dropConnection(error(4097));
    env.run();
  }

  NSFileProviderServiceSources sources(const std::string& identifier) {
    NSErrorPtr error;
    auto found = host.supportedServiceSourcesForItemIdentifier(identifier, &error);
    EXPECT_FALSE(error);
    return found;
  }
  template <class Object>
  Object* exported(const std::shared_ptr<NSXPCExportedObject>& object) {
    return dynamic_cast<Object*>(object.get());
  }

  // What happened since the last time, without what the lookups log of themselves.
  Lines take() {
    Lines lines = env.run();
    std::set<std::string> closings;
    std::erase_if(lines, [&](const std::string& line) {
      const auto asked = line.find(" asked ");
      if (line.starts_with("[DEBUG] ┏") && asked != std::string::npos) {
        const std::string opening = "[DEBUG] ┏";
        closings.insert("[DEBUG] ┗" + line.substr(opening.size(), asked - opening.size()) + " ");
        return true;
      }
      return closings.contains(line) || line.starts_with("[DEBUG] returning ") ||
             line.starts_with("[ERROR] returning nil") || line.starts_with("documents: url of");
    });
    return lines;
  }
  static NSErrorPtr error(std::int64_t code, const char* domain = NSCocoaErrorDomain) {
    return NSError::errorWithDomain(domain, code);
  }

  TestEnvironment env;
  ScriptedFramework& framework = env.framework;
  const std::shared_ptr<NSOperationQueue> queue =
      std::make_shared<NSOperationQueue>(env.environment.executor);
  std::shared_ptr<VLFileProviderExtension> extension =
      VLFileProviderExtension::init(std::make_shared<NSExtensionAttributes>(), env.environment);
  NSFileProviderExtension& host = *extension;
  const std::string document = documentID(1);
  const std::string folder = "i0000000000000007";
};

// The lookups as a proxy needs them, over the same store.
struct LookupByTable final : VLItemLookup {
  NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier) override {
    const auto found = urls.find(identifier);
    return found != urls.end() ? found->second : nullptr;
  }
  NSURLPtr _URLForItemWithPersistentIdentifier(const NSFileProviderItemIdentifier&, bool,
                                               bool) override {
    return nullptr;
  }
  std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr&) override {
    return std::nullopt;
  }
  bool _isLoggedInOrError(NSErrorOut) override { return true; }
  NSFileProviderItemPtr itemForIdentifier(const NSFileProviderItemIdentifier&,
                                          NSErrorOut) override {
    return nullptr;
  }
  NSFileProviderItemPtr _propertiesForItemAtURL(const NSURLPtr&, NSErrorOut) override {
    return nullptr;
  }
  NSFileProviderItemPtr _propertiesForNewItemAtURL(const NSURLPtr&, NSErrorOut) override {
    return nullptr;
  }

  std::map<std::string, NSURLPtr> urls{{documentID(1), storeURL("/a")},
                                       {"i0000000000000007", storeURL("/f")}};
};

// One exported proxy, called as the transport calls it.
template <class Proxy>
struct ProxyFixture : ServicesFixture {
  std::shared_ptr<Proxy> makeProxy(const std::string& identifier) {
    return std::make_shared<Proxy>(lookup, identifier, queue, env.environment);
  }
  // Writes "answer: " and the values.
  template <class... Words>
  void answered(const Words&... words) {
    std::string text = "answer:";
    ((text += " " + description(words)), ...);
    env.transcript.add(text);
  }
  // An error in words, as "domain code" or "no error".
  static std::string say(const NSErrorPtr& error) { return brief(error); }

  const std::shared_ptr<LookupByTable> lookup = std::make_shared<LookupByTable>();
};

inline CKSharePtr makeShare(std::string type, bool isKnownToServer) {
  CKShare share;
  share.values[CKShareTypeKey] = std::move(type);
  share.isKnownToServer = isKnownToServer;
  share.participants = {{"kim", CKShareParticipantRole::Owner}};
  share.publicPermission = CKShareParticipantPermissionReadWrite;
  return std::make_shared<const CKShare>(std::move(share));
}

}  // namespace skein
