#include "tests/support/ScriptedCloud.h"

#include <stdexcept>
#include <utility>

#include "platform/log/Description.h"

namespace skein {

void ScriptedFetch::cancel() {
  ++cancellations;
  _transcript.add("cloud: cancel");
}

CKRecordID ScriptedFetch::recordID(const std::string& name) const {
  for (const CKRecordID& id : recordIDs) {
    if (id.recordName == name) return id;
  }
  throw std::logic_error("the operation does not ask for " + name);
}

void ScriptedFetch::record(const std::string& name, std::map<std::string, CKRecord::Value> fields) {
  const CKRecordID id = recordID(name);
  perRecordCompletionBlock(std::make_shared<CKRecord>(id, std::move(fields)), id, nullptr);
}

void ScriptedFetch::fail(const std::string& name, const NSErrorPtr& error) {
  perRecordCompletionBlock(nullptr, recordID(name), error);
}

void ScriptedFetch::finish(const NSErrorPtr& error) {
  perRecordCompletionBlock = nullptr;
  std::exchange(fetchRecordsCompletionBlock, nullptr)(error);
}

std::shared_ptr<CKFetchRecordsOperation> ScriptedDatabase::fetchRecordsOperation() {
  return std::make_shared<ScriptedFetch>(_transcript);
}

void ScriptedDatabase::addOperation(std::shared_ptr<CKFetchRecordsOperation> operation) {
  std::string names;
  for (const CKRecordID& id : operation->recordIDs) names += " " + id.recordName;
  _transcript.add("cloud: " + _name + " fetches" + names + ", keys " +
                  description(operation->desiredKeys));
  const auto& configuration = operation->configuration;
  _transcript.add("cloud: quality " + std::to_string(operation->qualityOfService) +
                  ", discretionary " + std::to_string(configuration.discretionaryNetworkBehavior) +
                  (configuration.automaticallyRetryNetworkFailures ? ", retries" : ", no retries") +
                  ", group " + (operation->group ? operation->group->name() : "none"));
  _operations.push_back(std::dynamic_pointer_cast<ScriptedFetch>(operation));
}

std::shared_ptr<ScriptedFetch> ScriptedDatabase::next() {
  if (_operations.empty()) throw std::logic_error("no operation was added");
  auto operation = std::move(_operations.front());
  _operations.pop_front();
  return operation;
}

struct ScriptedCloud::Container final : CKContainer {
  explicit Container(Transcript& transcript)
      : own("private", transcript), shared("shared", transcript) {}
  CKDatabase& privateCloudDatabase() override { return own; }
  CKDatabase& sharedCloudDatabase() override { return shared; }

  ScriptedDatabase own;
  ScriptedDatabase shared;
};

ScriptedCloud::ScriptedCloud(Transcript& transcript)
    : ScriptedCloud(std::make_shared<Container>(transcript), transcript) {}

ScriptedCloud::ScriptedCloud(std::shared_ptr<Container> container, Transcript& transcript)
    : privateDatabase(container->own),
      sharedDatabase(container->shared),
      _container(std::move(container)),
      _transcript(transcript) {}

std::shared_ptr<CKContainer> ScriptedCloud::containerWithIdentifier(const std::string& identifier) {
  _transcript.add("cloud: container " + identifier);
  return _container;
}

bool ScriptedThumbnailTransfer::canMostRecentClientsGenerateThumbnailsForUTI(
    const std::optional<std::string>& typeIdentifier) {
  _transcript.add("renderable here: " + description(typeIdentifier));
  return typeIdentifier == renderableType;
}

void ScriptedThumbnailTransfer::VLStartDownloadForItemsWithOptions(
    const std::vector<NSURLPtr>& items, std::uint64_t options,
    UniqueFunction<void(NSErrorPtr)> completion) {
  _transcript.add("download of " + description(items) + " with " + std::to_string(options));
  if (holdsStarts) {
    starts.hold(std::move(completion));
  } else {
    completion(startError);
  }
}

}  // namespace skein
