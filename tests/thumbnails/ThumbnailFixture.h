#pragma once

#include <gtest/gtest.h>

#include <fstream>

#include "extension/VLFileProviderExtension.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"

namespace skein {

// A container whose icon a test decides.
class IconContainer final : public VLContainer {
 public:
  IconContainer(const std::string& containerID, std::optional<NSData> image, bool isAppIcon,
                Transcript& transcript)
      : VLContainer({containerID, nullptr, containerID, std::nullopt}),
        _image(std::move(image)),
        _isAppIcon(isAppIcon),
        _transcript(transcript) {}

  std::optional<NSData> bestFittingImageDataForSize(NSSize size,
                                                    bool& shouldTransformToAppIcon) const override {
    _transcript.add("icon of " + containerID() + " at " + std::to_string(int(size.width)) + "x" +
                    std::to_string(int(size.height)));
    shouldTransformToAppIcon = _isAppIcon;
    return _image;
  }

 private:
  const std::optional<NSData> _image;
  const bool _isAppIcon;
  Transcript& _transcript;
};

// The principal object, asked for thumbnails as a host does, over documents d1, d2, ... at
// /store/1, /store/2, ... of which the cloud has records named 1, 2, ...
struct ThumbnailFixture : testing::Test {
  ThumbnailFixture() {
    for (std::uint64_t number = 1; number <= 6; ++number) {
      framework.documents.urls[VLFileObjectID::documentWithRawID(number)] =
          storeURL("/" + std::to_string(number));
    }
    env.run();
  }

  std::shared_ptr<NSProgress> fetch(const std::vector<std::string>& identifiers,
                                    NSSize size = {64, 64}) {
    return host.fetchThumbnailsForItemIdentifiersWithType(identifiers, size, perThumbnail(),
                                                          completion());
  }

  // Handlers that write what they are given into the transcript.
  NSFileProviderExtension::ThumbnailWithTypeHandler perThumbnail() {
    return [this](const std::string& identifier, const std::optional<NSData>& data,
                  const std::optional<std::string>& type, const NSErrorPtr& error) {
      env.transcript.add("thumbnail of " + identifier + ": " + say(data) + ", " +
                         type.value_or("no type") + ", " + brief(error));
    };
  }
  NSFileProviderExtension::ErrorCompletion completion() {
    return [this](const NSErrorPtr& error) { env.transcript.add("completed: " + brief(error)); };
  }
  static std::string say(const std::optional<NSData>& data) {
    return data ? "\"" + std::string(data->view()) + "\"" : "no data";
  }

  // From now on vald answers so, at once: the asking thread then has nothing to wait for,
  // which is what a manual executor needs.
  void answerWithRecords(std::optional<VLContentRecordIDs> records,
                         const NSErrorPtr& error = nullptr) {
    framework.daemon.contentRecords.handTo(
        [records, error](const auto& call) { call->reply(records, error); });
  }
  static CKRecordID recordID(std::uint64_t number, const CKRecordZoneID& zone) {
    return {std::to_string(number), zone};
  }
  VLContentRecordIDs inOneZone(std::initializer_list<std::uint64_t> numbers) const {
    VLContentRecordIDs records;
    for (const std::uint64_t number : numbers) {
      records.emplace(VLFileObjectID::documentWithRawID(number), recordID(number, own));
    }
    return records;
  }

  // The fields of a record whose thumbnail is a file with these contents.
  std::map<std::string, CKRecord::Value> thumbnail(const std::string& contents) {
    const std::string path = testing::TempDir() + "thumbnail";
    std::ofstream(path) << contents;
    const auto asset = std::make_shared<const CKAsset>(CKAsset{NSURL::fileURLWithPath(path)});
    return {{kVLRecordKeyThumbnail1024x1024, asset}, {kVLRecordKeySize, std::int64_t{5}}};
  }
  static std::map<std::string, CKRecord::Value> size(std::int64_t bytes) {
    return {{kVLRecordKeySize, bytes}};
  }

  // What happened since the last time, without what the lookups say of themselves.
  Lines take() {
    Lines lines = env.run();
    std::erase_if(lines, [](const std::string& line) {
      return line.find(" asked ") != std::string::npos || line.starts_with("[DEBUG] returning ") ||
             line.starts_with("documents: url of") || line.starts_with("[ERROR] returning nil") ||
             line.starts_with("items: ask");
    });
    return lines;
  }
  Lines takeCalls() {
    Lines lines = take();
    std::erase_if(lines, [](const std::string& line) { return line.starts_with("["); });
    return lines;
  }

  TestEnvironment env;
  ScriptedFramework& framework = env.framework;
  std::shared_ptr<VLFileProviderExtension> extension =
      VLFileProviderExtension::init(std::make_shared<NSExtensionAttributes>(), env.environment);
  NSFileProviderExtension& host = *extension;
  const CKRecordZoneID own{"documents", CKCurrentUserDefaultName};
  const CKRecordZoneID others{"documents", "ada"};
  const NSErrorPtr cloudError = NSError::errorWithDomain("CKErrorDomain", 3);
};

}  // namespace skein
