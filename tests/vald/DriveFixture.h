// A whole drive over a folder of the test's own: its store, its cloud, and what is done to
// its documents, asked as a client asks.
#pragma once

#include <gtest/gtest.h>

#include <future>
#include <memory>
#include <optional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "linux/vald/Drive.h"
#include "linux/vald/files/FaultyFileLayer.h"
#include "tests/vald/StoreFixture.h"

namespace skein::vald {

class DriveFixture : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  void open();
  void close() { drive.reset(); }
  void reopen();
  void settle();

  // Paths are relative to the drive's folder, or absolute in a container's.
  std::string at(const std::string& path) const {
    return path.starts_with('/') ? path : root + '/' + path;
  }
  NSURLPtr url(const std::string& path) const;
  void write(const std::string& path, const std::string& text = "contents");
  std::string read(const std::string& path) const;
  bool exists(const std::string& path) const;
  void rename(const std::string& from, const std::string& to);

  VLQueryItemPtr item(const std::string& path);
  std::string id(const std::string& path);
  std::vector<std::string> tags(const std::string& path);
  // All that must not be lost: identifier, tags, rank, date of use, date of birth.
  std::string portrait(const std::string& path);
  // The names in the drive's folder, as it is listed.
  std::vector<std::string> listed(const std::string& folder = {});
  std::vector<IndexDifference> differences() { return drive->store().check(10); }

  // Makes a request and waits for its one answer.
  template <class... Values, class Request>
  std::tuple<Values...> ask(Request request) {
    auto answer = std::make_shared<std::promise<std::tuple<Values...>>>();
    auto future = answer->get_future();
    request(drive->files(), Reply<Values...>([answer](Values... values) {
              answer->set_value(std::tuple<Values...>(std::move(values)...));
            }));
    if (future.wait_for(std::chrono::seconds(30)) != std::future_status::ready) {
      ADD_FAILURE() << "never answered";
      return {};
    }
    return future.get();
  }
  // The path that an operation answers with, relative to the drive where it is in there; "!" and
  // the error's code.
  template <class Request>
  std::string path(Request request) {
    const auto [found, error] = ask<NSURLPtr, NSErrorPtr>(request);
    if (error) return "!" + std::to_string(error->code());
    if (!found) return "";
    return found->path().starts_with(root + '/') ? found->path().substr(root.size() + 1)
                                                 : found->path();
  }
  // "" or "!" and the error's code.
  template <class Request>
  std::string outcome(Request request) {
    const auto error = std::get<0>(ask<NSErrorPtr>(request));
    return error ? "!" + std::to_string(error->code()) : "";
  }
  std::string renamed(const std::string& from, const std::string& name);
  std::string moved(const std::string& from, const std::string& folder, bool bounce = false);
  std::string trashed(const std::string& what);
  std::string removed(const std::string& what);
  std::string tagged(const std::string& what, std::vector<std::string> names);
  std::string ranked(const std::string& what, std::optional<std::int64_t> rank);
  std::string used(const std::string& what, NSDate date);
  std::string evicted(const std::string& what);
  std::string downloaded(const std::string& what);
  // Waits until the store knows that the document is uploaded.
  bool uploaded(const std::string& what);
  // Waits until `holds` does, asking anew after each change of the store.
  bool eventually(const std::function<bool()>& holds);

  std::string base;
  std::string root;
  DriveOptions options;
  FaultyFileLayer layer;
  SilentLog log;
  std::unique_ptr<Drive> drive;

 private:
  // Counts what the store tells.
  class Listener final : public StoreListener {
   public:
    void storeDidChange(const std::vector<StoreChange>&) override SKEIN_EXCLUDES(_mutex) { tell(); }
    void storeDidOverflow(std::optional<VLFileObjectID>) override SKEIN_EXCLUDES(_mutex) { tell(); }
    std::uint64_t told() SKEIN_EXCLUDES(_mutex);
    // Until more than `told` were told, or a moment passed.
    void wait(std::uint64_t told) SKEIN_EXCLUDES(_mutex);

   private:
    void tell() SKEIN_EXCLUDES(_mutex);
    Mutex _mutex;
    CondVar _changed;
    std::uint64_t _told SKEIN_GUARDED_BY(_mutex) = 0;
  };
  Listener _listener;
};

}  // namespace skein::vald
