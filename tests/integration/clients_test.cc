// Eight clients at once on one tree, while vald is made to fail and is killed: every request
// is answered, once; nothing goes away that no request took away; in the end the disk, the
// index and the listing agree. SKEIN_LONG=1 makes a minute of it.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <map>
#include <nlohmann/json.hpp>
#include <random>
#include <thread>

#include "base/ThreadPool.h"
#include "linux/protocol/DaemonClient.h"
#include "linux/protocol/HostClient.h"
#include "tests/integration/Drive.h"
#include "tests/protocol/Waiting.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

constexpr int kClients = 8;
constexpr auto kBetweenFaults = 100ms;

// What every client sees: the documents and folders that somebody made.
class Tree {
 public:
  void addDocument(const std::string& identifier, const std::string& text) {
    MutexLock lock(_mutex);
    _documents[identifier] = text;
    _identifiers.push_back(identifier);
  }
  void addFolder(const std::string& identifier) {
    MutexLock lock(_mutex);
    _folders.push_back(identifier);
  }
  HostTarget document(std::mt19937& random) const {
    MutexLock lock(_mutex);
    return pick(_identifiers, random);
  }
  HostTarget folder(std::mt19937& random) const {
    MutexLock lock(_mutex);
    return pick(_folders, random);
  }
  std::map<std::string, std::string> documents() const {
    MutexLock lock(_mutex);
    return _documents;
  }

 private:
  static HostTarget pick(const std::vector<std::string>& from, std::mt19937& random) {
    if (from.empty()) return HostTarget::path("/nothing-yet");
    return HostTarget::identifier(from[random() % from.size()]);
  }

  mutable Mutex _mutex;
  std::map<std::string, std::string> _documents SKEIN_GUARDED_BY(_mutex);
  std::vector<std::string> _identifiers SKEIN_GUARDED_BY(_mutex);
  std::vector<std::string> _folders SKEIN_GUARDED_BY(_mutex){
      NSFileProviderRootContainerItemIdentifier};
};

// The answers to all requests, counted.
struct Tally {
  std::atomic<std::uint64_t> answered{0};
  std::atomic<std::uint64_t> failed{0};
  std::atomic<std::uint64_t> unanswered{0};
  std::atomic<std::uint64_t> answeredAgain{0};
};

// One answer, which must come once, and by the test's deadline.
template <class... Values>
class Answer {
 public:
  explicit Answer(Tally& tally) : _tally(tally) {}

  Reply<Values..., NSErrorPtr> reply() {
    return [state = _state, &tally = _tally](Values... values, NSErrorPtr error) {
      if (state->replies.fetch_add(1) > 0) ++tally.answeredAgain;
      state->inbox.add({std::move(values)..., std::move(error)});
    };
  }
  // Nothing when none came.
  std::optional<std::tuple<Values..., NSErrorPtr>> wait() {
    auto answer = _state->inbox.take();
    if (!answer) {
      ++_tally.unanswered;
    } else {
      ++(std::get<NSErrorPtr>(*answer) ? _tally.failed : _tally.answered);
    }
    return answer;
  }

 private:
  struct State {
    std::atomic<int> replies{0};
    Inbox<std::tuple<Values..., NSErrorPtr>> inbox;
  };
  Tally& _tally;
  const std::shared_ptr<State> _state = std::make_shared<State>();
};

std::shared_ptr<HostService> connect(const std::string& socket) {
  return makeHostClient(RpcLoop::start("client"), std::make_shared<ThreadPool>(1, "client"),
                        {"skein-host", socket, std::nullopt, 4000ms});
}

// A client with a connection of its own.
class Client {
 public:
  Client(const std::string& socket, std::string sources, int number, Tree& tree, Tally& tally)
      : _origin("client " + std::to_string(number)),
        _sources(std::move(sources)),
        _random(static_cast<unsigned>(number)),
        _tree(tree),
        _tally(tally),
        _host(connect(socket)) {}

  void work(Clock::time_point end) {
    while (Clock::now() < end) perform(_random() % 12);
  }

 private:
  void perform(unsigned kind) {
    HostFiles& files = _host->files();
    const HostTarget document = _tree.document(_random);
    switch (kind) {
      case 0:
      case 1:
      case 2: import(); break;
      case 3: {
        Answer<HostItem> made(_tally);
        files.createDirectory(fresh("folder"), _tree.folder(_random), _origin, made.reply());
        if (const auto item = itemOf(made)) _tree.addFolder(item->itemIdentifier());
        break;
      }
      case 4:
        change([&](auto reply) {
          files.rename(document, fresh("renamed"), _origin, std::move(reply));
        });
        break;
      case 5:
        follow([&](auto reply) {
          files.reparent(document, _tree.folder(_random), std::nullopt, _origin, std::move(reply));
        });
        break;
      case 6: change([&](auto reply) { files.trash(document, _origin, std::move(reply)); }); break;
      case 7:
        change(
            [&](auto reply) { files.untrash(document, std::nullopt, _origin, std::move(reply)); });
        break;
      case 8: follow([&](auto reply) { files.remove(document, _origin, std::move(reply)); }); break;
      case 9:
        change([&](auto reply) {
          files.setTags(document, {"tag", fresh("tag")}, std::move(reply));
        });
        break;
      case 10: {
        Answer<> evicted(_tally);
        files.evict(document, evicted.reply());
        evicted.wait();
        break;
      }
      default: follow([&](auto reply) { files.contents(document, false, std::move(reply)); });
    }
  }

  void import() {
    const std::string name = fresh("document");
    const std::string text = "the text of " + name + " by " + _origin + '\n';
    const std::string source = _sources + '/' + name;
    std::ofstream(source, std::ios::binary) << text;
    const auto item = follow([&](auto reply) {
      _host->files().importDocument(source, _tree.folder(_random), _origin, std::move(reply));
    });
    if (item) _tree.addDocument(item->itemIdentifier(), text);
    fs::remove(source);
  }

  template <class Start>
  void change(Start start) {
    Answer<HostItem> changed(_tally);
    start(changed.reply());
    changed.wait();
  }

  // A transfer to its end; one in eight is given up on the way.
  template <class Start>
  NSFileProviderItemPtr follow(Start start) {
    Answer<std::shared_ptr<HostTransfer>> begun(_tally);
    start(begun.reply());
    const auto answer = begun.wait();
    const auto transfer = answer ? std::get<0>(*answer) : nullptr;
    if (!transfer || _random() % 8 == 0) return nullptr;
    for (;;) {
      Answer<HostTransferStep> next(_tally);
      transfer->next(next.reply());
      const auto step = next.wait();
      if (!step || std::get<1>(*step)) return nullptr;
      if (std::get<0>(*step).finished) return std::get<0>(*step).item.item;
    }
  }

  static NSFileProviderItemPtr itemOf(Answer<HostItem>& answer) {
    const auto got = answer.wait();
    return got ? std::get<0>(*got).item : nullptr;
  }
  std::string fresh(const char* stem) {
    return stem + ("-" + _origin.substr(7)) + '-' + std::to_string(++_count);
  }

  const RequestOrigin _origin;
  const std::string _sources;
  std::mt19937 _random;
  std::uint64_t _count = 0;
  Tree& _tree;
  Tally& _tally;
  const std::shared_ptr<HostService> _host;
};

// Has vald fail in every way it can, and kills it three times.
class Trouble {
 public:
  Trouble(const Drive& drive, Clock::time_point end) : _drive(drive), _end(end) {}

  void run() {
    const auto loop = RpcLoop::start("trouble");
    const auto executor = std::make_shared<ThreadPool>(1, "trouble");
    DaemonClient::Options options;
    options.socketPath = _drive.socketOf("vald");
    const auto daemon = std::make_shared<DaemonClient>(loop, executor, std::move(options));
    const auto begin = Clock::now();
    auto nextKill = begin + (_end - begin) / 4;
    while (Clock::now() < _end) {
      inject(*daemon);
      if (Clock::now() < nextKill) continue;
      nextKill += (_end - begin) / 4;
      if (kills == 3) continue;
      const pid_t vald = _drive.daemon();
      if (vald > 0 && kill(vald, SIGKILL) == 0) ++kills;
    }
  }

  int kills = 0;
  std::uint64_t faults = 0;

 private:
  // Asks for one fault, and lets some time pass.
  void inject(DaemonClient& daemon) {
    static constexpr const char* kMethods[] = {
        "importDocument", "createFolder", "rename",      "move",
        "remove",         "trash",        "putBackURL",  "capabilityToMove",
        "download",       "evict",        "setTagNames", "queryItemForURL"};
    FaultInjection fault;
    fault.method = kMethods[_random() % std::size(kMethods)];
    fault.action = static_cast<FaultInjection::Action>(_random() % 3);
    fault.errorDomain = NSCocoaErrorDomain;
    fault.errorCode = NSFileWriteUnknownError;
    fault.delayMilliseconds = 50;
    Outcome<NSErrorPtr> outcome;
    daemon.remoteObjectProxyWithErrorHandler(outcome.errorHandler())
        ->injectFault(fault, outcome.reply());
    const auto next = std::min(_end, Clock::now() + kBetweenFaults);
    MutexLock lock(_mutex);
    while (Clock::now() < next) _time.waitUntil(_mutex, next);
    faults += outcome.replies->count();
  }

  const Drive& _drive;
  const Clock::time_point _end;
  Mutex _mutex;
  CondVar _time;  // passes; nobody notifies it
  std::mt19937 _random{20261125};
};

struct Present {
  std::string path;
  bool isDownloaded = false;
};

// Every document that is listed or in the trash, by identifier.
std::map<std::string, Present> presentDocuments(const Drive& drive) {
  std::map<std::string, Present> present;
  for (const Arguments& arguments :
       {Arguments{"ls", "-R", "--json", "/"}, Arguments{"trash", "list", "--json"}}) {
    const Result result = drive.run(arguments);
    EXPECT_EQ(result.code, 0) << result.errors;
    for (const std::string& line : result.lines()) {
      const auto item = nlohmann::json::parse(line);
      if (item["kind"] == "document") present[item["id"]] = {item["path"], item["downloaded"]};
    }
  }
  return present;
}

// Whether a request of a client removed the document.
bool hasBeenRemoved(HostService& host, const std::string& identifier) {
  Tally tally;
  Answer<std::vector<FileHistoryEntry>> answer(tally);
  host.files().history(HostTarget::identifier(identifier), 100, answer.reply());
  const auto history = answer.wait();
  if (!history) return false;
  const auto& entries = std::get<0>(*history);
  return std::any_of(entries.begin(), entries.end(), [](const FileHistoryEntry& entry) {
    return entry.operation == "remove" && !entry.undone && entry.origin.starts_with("client ");
  });
}

TEST(Clients, AreAllAnsweredAndLoseNothingWhileValdFailsAndIsKilled) {
  const bool isLong = std::getenv("SKEIN_LONG") != nullptr;
  Drive drive;
  ASSERT_EQ(drive.run({"status"}).code, 0);
  const std::string socket = drive.socketOf("skein-host");
  Tree tree;
  Tally tally;
  const auto end = Clock::now() + (isLong ? 60s : 6s);
  Trouble trouble(drive, end);
  {
    std::vector<std::jthread> threads;
    for (int number = 0; number < kClients; ++number) {
      threads.emplace_back(
          [&, number] { Client(socket, drive.home(), number, tree, tally).work(end); });
    }
    trouble.run();
  }
  std::cout << tally.answered + tally.failed << " requests answered, " << tally.failed
            << " with an error; " << trouble.faults << " faults, " << trouble.kills << " kills\n";
  EXPECT_EQ(trouble.kills, 3);
  EXPECT_GT(trouble.faults, 0U);
  EXPECT_GT(tally.answered, 50U);
  EXPECT_EQ(tally.unanswered, 0U);
  EXPECT_EQ(tally.answeredAgain, 0U);

  const Result doctor = drive.run({"doctor"});
  EXPECT_EQ(doctor.code, 0) << doctor.output;
  const auto present = presentDocuments(drive);
  const auto host = connect(socket);
  for (const auto& [identifier, text] : tree.documents()) {
    const auto at = present.find(identifier);
    if (at == present.end()) {
      EXPECT_TRUE(hasBeenRemoved(*host, identifier)) << "nobody removed " << text;
    } else if (at->second.isDownloaded) {
      std::ifstream file(drive.store() + at->second.path, std::ios::binary);
      EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), text) << at->second.path;
    } else {
      EXPECT_EQ(drive.run({"cat", identifier}).output, text) << at->second.path;
    }
  }
}

}  // namespace
}  // namespace skein
