#pragma once

#include <gtest/gtest.h>

#include <set>

#include "extension/VLFileProviderExtension.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"

namespace skein {

// The principal object, asked as a host does, over a store with a document at /store/a, a
// folder at /store/f and an alias at /store/alias whose target is /store/target.
struct OperationsFixture : testing::Test {
  OperationsFixture() {
    framework.documents.urls = {{VLFileObjectID::documentWithRawID(1), storeURL("/a")},
                                {VLFileObjectID::folderOrAliasWithRawID(7), storeURL("/f")},
                                {VLFileObjectID::folderOrAliasWithRawID(9), storeURL("/alias")}};
    framework.documents.references["/store/alias"] = storeURL("/target");
    framework.queryItems.items["/store/f/new"] = makeItem(5, false, "new");
    env.run();
  }

  // Handlers that write what they are given into the transcript.
  ItemCompletion answer() {
    return [this](const NSFileProviderItemPtr& item, const NSErrorPtr& error) {
      env.transcript.add("answer: " + (item ? item->filename() : "no item") + ", " + say(error));
      lastError = error;
    };
  }
  ErrorCompletion errorAnswer() {
    return [this](const NSErrorPtr& error) {
      env.transcript.add("answer: " + say(error));
      lastError = error;
    };
  }

  // What happened since the last time, without the lines that a lookup logs of itself and
  // its question to the documents; what its flags make it do stays.
  Lines take() {
    Lines lines = env.run();
    std::set<std::string> closings;
    std::erase_if(lines, [&](const std::string& line) {
      constexpr std::string_view kOpening = "[DEBUG] ┏";
      const auto asked = line.find(" asked ");
      if (line.starts_with(kOpening) && asked != std::string::npos) {
        const std::string number = line.substr(kOpening.size(), asked - kOpening.size());
        return closings.insert("[DEBUG] ┗" + number + " ").second;
      }
      return closings.contains(line) || line.starts_with("[DEBUG] returning ") ||
             line.starts_with("[DEBUG] we have a bookmark") ||
             line.starts_with("[ERROR] returning nil") || line.starts_with("documents: url of");
    });
    return lines;
  }
  // The framework's file operation ends.
  Lines finish(const NSURLPtr& newURL, const NSErrorPtr& error = nullptr) {
    framework.fileOperations.results.next()->reply(newURL, error);
    return take();
  }
  Lines finishDeletion(const NSErrorPtr& error) {
    framework.fileOperations.deletions.next()->reply(error);
    return take();
  }

  // An error in an answer: with the identifier or the item that it carries.
  static std::string say(const NSErrorPtr& error) {
    std::string text = brief(error);
    if (!error) return text;
    for (const auto& [key, value] : error->userInfo()) {
      if (key == NSFileProviderErrorNonExistentItemIdentifierKey) {
        text += " of " + std::get<std::string>(value);
      } else if (key == NSFileProviderErrorCollidingItemKey) {
        text += " with " + std::get<NSFileProviderItemPtr>(value)->filename();
      }
    }
    return text;
  }
  static NSErrorPtr cocoa(std::int64_t code) {
    return NSError::errorWithDomain(NSCocoaErrorDomain, code);
  }
  // A name that is taken by what is at `url`.
  static NSErrorPtr fileExists(const NSURLPtr& url) {
    return NSError::errorWithDomain(NSCocoaErrorDomain, 516, {{NSURLErrorKey, url}});
  }

  TestEnvironment env;
  ScriptedFramework& framework = env.framework;
  std::shared_ptr<VLFileProviderExtension> extension =
      VLFileProviderExtension::init(std::make_shared<NSExtensionAttributes>(), env.environment);
  NSFileProviderExtension& host = *extension;
  const std::string document = documentID(1);
  const std::string folder = "i0000000000000007";
  const std::string alias = "i0000000000000009";
  const std::string unknown = documentID(99);
  NSErrorPtr lastError;
};

}  // namespace skein
