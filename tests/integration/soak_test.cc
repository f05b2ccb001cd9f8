// Eight clients at once use every command on one tree, other programs write to it meanwhile, and
// vald and skein-host are killed: what was named by its identifier is what was changed, nothing
// goes that nobody removed, contents stay what they were, listings show what is there, and nothing
// is left open in the end. SKEIN_SOAK=SECONDS asks for it, SKEIN_SEED=NUMBER repeats what the
// clients decide.
//
// The model claims what is certain alone: what a command does that was under way at a kill, or
// whose answer does not tell, may have been done or not.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <map>
#include <nlohmann/json.hpp>
#include <random>
#include <set>
#include <sstream>
#include <thread>

#include "base/Mutex.h"
#include "tests/integration/Drive.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;
using Json = nlohmann::json;

constexpr int kClients = 8;
constexpr int kKills = 10;
constexpr char kTrash[] = "the trash";
constexpr int kNoSuchItem = 3;
constexpr int kRefused = 8;
constexpr int kInterrupted = 130;

// What is claimed of one document. Its token is in its contents, its tags and titles, and in those
// of no other; in its name as long as nobody exchanges it.
struct Document {
  enum class Presence { Certain, Uncertain, Gone };
  std::string token;
  std::string identifier;  // empty: not known, or not certain
  Presence presence = Presence::Certain;
  std::vector<std::string> texts;   // what it may contain
  std::vector<std::string> places;  // where it may be; none: anywhere
  bool isShared = false;            // anybody may move, trash and remove it
  // What others did to its name since vald last told of it.
  int touches = 0;
  bool isReplaced = false;  // by another file

  bool isAt() const { return places.size() == 1 && places.front() != kTrash; }
  bool isInTrash() const { return places.size() == 1 && places.front() == kTrash; }
  // Whether the identifier surely means it: a file that was saved to another's name keeps its
  // identifier when that is all that happened.
  bool isNamed() const { return !identifier.empty() && !(isReplaced && touches > 1); }
};
using DocumentPtr = std::shared_ptr<Document>;

// The documents that all clients see.
class Everybody {
 public:
  void add(const DocumentPtr& document) {
    MutexLock lock(_mutex);
    _all.push_back(document);
  }
  void publish(const std::string& identifier) {
    MutexLock lock(_mutex);
    _published.push_back(identifier);
  }
  void share(const DocumentPtr& document) {
    MutexLock lock(_mutex);
    _shared.push_back(document);
  }
  // Of any document; empty when there is none.
  std::string anyIdentifier(std::mt19937& random) const {
    MutexLock lock(_mutex);
    return _published.empty() ? std::string() : _published[random() % _published.size()];
  }
  DocumentPtr anyShared(std::mt19937& random) const {
    MutexLock lock(_mutex);
    return _shared.empty() ? nullptr : _shared[random() % _shared.size()];
  }
  // Of a shared document, which several clients may remove at once.
  void note(const DocumentPtr& document, Document::Presence presence) {
    MutexLock lock(_mutex);
    if (document->presence != Document::Presence::Gone) document->presence = presence;
  }
  std::vector<DocumentPtr> all() const {
    MutexLock lock(_mutex);
    return _all;
  }

 private:
  mutable Mutex _mutex;
  std::vector<DocumentPtr> _all SKEIN_GUARDED_BY(_mutex);
  std::vector<DocumentPtr> _shared SKEIN_GUARDED_BY(_mutex);
  std::vector<std::string> _published SKEIN_GUARDED_BY(_mutex);
};

struct Work {
  const Drive& drive;
  const unsigned seed;
  Everybody everybody;
  std::atomic<bool> isOver{false};
  std::atomic<int> kills{0};  // counted before and after each
  std::atomic<std::uint64_t> commands{0};
  std::atomic<std::uint64_t> failed{0};
  std::atomic<std::uint64_t> uncertain{0};
  std::atomic<std::uint64_t> outside{0};
};

std::optional<std::string> contentsOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  if (!file) return std::nullopt;
  return std::string(std::istreambuf_iterator<char>(file), {});
}

// The one line of JSON that a command printed; empty when it did not.
Json answerOf(const Result& result) {
  const auto lines = result.lines();
  const Json answer = lines.empty() ? Json() : Json::parse(lines.front(), nullptr, false);
  return answer.is_object() ? answer : Json::object();
}

// A client: one command after the other on documents of its own, and on what all share.
class Client {
 public:
  Client(Work& run, int number)
      : _run(run),
        _name("c" + std::to_string(number)),
        _random(run.seed * 100 + static_cast<unsigned>(number)),
        _folders({"/" + _name, "/" + _name + "/inner"}) {
    for (const std::string& folder : _folders) fs::create_directory(run.drive.store() + folder);
  }

  void work() {
    while (!_run.isOver && !testing::Test::HasFailure()) perform(_random() % 24);
  }

 private:
  enum class Answer { Done, NotDone, Uncertain };

  void perform(unsigned kind) {
    std::erase_if(_own,
                  [](const DocumentPtr& one) { return one->presence == Document::Presence::Gone; });
    const DocumentPtr own = _own.empty() ? nullptr : _own[_random() % _own.size()];
    if (kind < 3 || !own) {
      create();
    } else if (kind < 9) {
      change(own);
    } else if (kind < 14) {
      touchOutside(own);
    } else if (kind < 18) {
      changeShared();
    } else if (kind < 20) {
      mark(own);
    } else if (kind < 22) {
      look(own);
    } else {
      askAnything();
    }
  }

  // ---- commands

  struct Asked {
    Result result;
    Answer answer = Answer::Uncertain;
  };

  // `interrupted`: a signal comes at some moment while it runs.
  Asked ask(const Arguments& arguments, bool interrupted = false) {
    const int before = _run.kills;
    Asked asked;
    const auto process = _run.drive.start(arguments);
    std::optional<std::string> line;
    if (interrupted) {
      line = process->readLine(std::chrono::milliseconds(_random() % 200));
      kill(process->pid(), SIGINT);
    }
    asked.result.code = process->finish(60s);
    asked.result.output = (line ? *line + '\n' : "") + process->output;
    asked.result.errors = process->errors;
    const int code = asked.result.code;
    const bool isDisturbed = before % 2 != 0 || before != _run.kills;
    if (code == 0) {
      asked.answer = Answer::Done;
    } else if (!isDisturbed && (code == kNoSuchItem || code == kRefused || code == kInterrupted)) {
      asked.answer = Answer::NotDone;
    }
    ++_run.commands;
    if (code != 0) ++_run.failed;
    if (asked.answer == Answer::Uncertain) ++_run.uncertain;
    if (code >= 0 && (code < 128 || code == kInterrupted)) return asked;
    ADD_FAILURE() << told(arguments, asked.result);
    return asked;
  }

  static std::string told(const Arguments& arguments, const Result& result) {
    std::string text = "skein";
    for (const std::string& one : arguments) text += ' ' + one;
    return text + ": " + std::to_string(result.code) + ' ' + result.errors + result.output;
  }

  // Expects that a document that is surely there was found.
  static void expectFound(const Arguments& arguments, const Asked& asked) {
    EXPECT_FALSE(asked.answer == Answer::NotDone && asked.result.code == kNoSuchItem)
        << told(arguments, asked.result);
  }

  // ---- documents of its own

  std::string textOf(const std::string& token) {
    return token + "\nrevision " + std::to_string(++_count) + " of it\n" +
           std::string(_random() % 3000, 'x') + '\n';
  }

  DocumentPtr newDocument(const std::string& folder) {
    const auto document = std::make_shared<Document>();
    document->token = _name + '-' + std::to_string(++_count);
    document->texts = {textOf(document->token)};
    document->places = {folder + '/' + document->token + ".txt"};
    return document;
  }

  void create() {
    const bool isShared = _random() % 3 == 0;
    const DocumentPtr document = newDocument(isShared ? sharedFolder() : folder());
    document->isShared = isShared;
    const std::string path = document->places.front();
    const std::size_t slash = path.rfind('/');
    if (!isShared && _random() % 2 == 0) {
      std::ofstream(_run.drive.store() + path, std::ios::binary) << document->texts.front();
      ++_run.outside;
      _run.everybody.add(document);
      _own.push_back(document);
      return;
    }
    const std::string source = _run.drive.home() + path.substr(slash);
    std::ofstream(source, std::ios::binary) << document->texts.front();
    const Arguments arguments = {"import", "--json", source, path.substr(0, slash)};
    document->presence = Document::Presence::Uncertain;
    _run.everybody.add(document);
    const Asked asked = ask(arguments, _random() % 8 == 0);
    fs::remove(source);
    if (asked.answer == Answer::NotDone) document->presence = Document::Presence::Gone;
    if (asked.answer != Answer::Done) return;
    const Json answer = answerOf(asked.result);
    EXPECT_EQ(answer.value("path", ""), path);
    document->identifier = answer.value("id", "");
    document->presence = Document::Presence::Certain;
    _run.everybody.publish(document->identifier);
    if (isShared) document->places.clear();
    isShared ? _run.everybody.share(document) : _own.push_back(document);
  }

  static std::string folderOf(const Document& document) {
    return fs::path(document.places.front()).parent_path();
  }

  // How a command names it: its identifier, or its path when that is certain; empty: not at all.
  std::string nameOf(const Document& document) {
    const bool byPath = document.isAt() && (_random() % 3 == 0 || !document.isNamed());
    return byPath ? document.places.front() : document.isNamed() ? document.identifier : "";
  }

  // vald told of the document.
  static void settle(Document& document, const Json& answer) {
    const std::string identifier = answer.value("id", "");
    if (identifier.empty()) return;
    if (document.isNamed()) {
      EXPECT_EQ(identifier, document.identifier) << document.token;
    }
    document.identifier = identifier;
    document.touches = 0;
    document.isReplaced = false;
  }

  void change(const DocumentPtr& own) {
    Document& document = *own;
    const std::string name = nameOf(document);
    if (name.empty()) return;
    switch (_random() % 6) {
      case 0: {  // a new name
        if (document.isInTrash()) return;
        const std::string to = document.isAt() ? folderOf(document) : folder();
        move(document, {"mv", "--json", name, to + '/' + fresh(document)},
             to + "/" + document.token + '-' + std::to_string(_count) + ".txt");
        break;
      }
      case 1: {  // another folder
        if (!document.isAt()) return;
        const std::string to = folder();
        move(document, {"mv", "--json", name, to},
             to + '/' + fs::path(document.places.front()).filename().string());
        break;
      }
      case 2:
      case 3:
        if (document.isInTrash()) {
          restore(document);
        } else {
          move(document, {"trash", "--json", name}, kTrash);
        }
        break;
      case 4:
        if (document.isInTrash()) restore(document);
        break;
      default: {
        const Asked asked = ask({"rm", "--json", name}, _random() % 4 == 0);
        expectFound({"rm", name}, asked);
        if (asked.answer == Answer::Done) document.presence = Document::Presence::Gone;
        if (asked.answer == Answer::Uncertain) document.presence = Document::Presence::Uncertain;
      }
    }
  }

  std::string fresh(const Document& document) {
    return document.token + '-' + std::to_string(++_count) + ".txt";
  }

  void move(Document& document, const Arguments& arguments, const std::string& to) {
    if (std::count(document.places.begin(), document.places.end(), to) > 0) return;
    const std::vector<std::string> before = document.places;
    document.places.push_back(to);
    const Asked asked = ask(arguments);
    if (document.presence == Document::Presence::Certain) expectFound(arguments, asked);
    if (asked.answer == Answer::NotDone) document.places = before;
    if (asked.answer != Answer::Done) return;
    document.places = {to};
    const Json answer = answerOf(asked.result);
    if (to != kTrash) {
      EXPECT_EQ(answer.value("path", ""), to) << told(arguments, asked.result);
    }
    settle(document, answer);
    document.presence = Document::Presence::Certain;
  }

  void restore(Document& document) {
    if (!document.isNamed()) return;
    const std::string to = folder();
    const Arguments arguments = {"restore", "--json", document.identifier, "--to", to};
    const Asked asked = ask(arguments);
    // The name that it had is not noted where it lies.
    if (asked.answer == Answer::Uncertain) document.places.clear();
    if (asked.answer != Answer::Done) return;
    const Json answer = answerOf(asked.result);
    document.places = {answer.value("path", "")};
    EXPECT_TRUE(document.places.front().starts_with(to + '/')) << told(arguments, asked.result);
    settle(document, answer);
  }

  // What other programs do, while others may evict, download and look at the same document.
  void touchOutside(const DocumentPtr& own) {
    Document& document = *own;
    if (!document.isAt() || document.presence != Document::Presence::Certain) return;
    const std::string path = _run.drive.store() + document.places.front();
    const std::string text = textOf(document.token);
    ++_run.outside;
    switch (_random() % 4) {
      case 0: {  // written in its place
        const FileDescriptor file(open(path.c_str(), O_WRONLY | O_CLOEXEC));
        if (!file || ftruncate(file.get(), 0) != 0) return;
        EXPECT_EQ(write(file.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
        document.texts = {text};
        break;
      }
      case 1: {  // saved
        if (access(path.c_str(), F_OK) != 0) return;
        const std::string temporary = path + ".tmp";
        std::ofstream(temporary, std::ios::binary) << text;
        fs::rename(temporary, path);
        document.texts = {text};
        document.isReplaced = true;
        ++document.touches;
        break;
      }
      case 2: {  // renamed
        const std::string to = folder() + '/' + fresh(document);
        if (!renameNew(path, _run.drive.store() + to)) return;
        document.places = {to};
        ++document.touches;
        break;
      }
      default: {  // exchanged with another
        const DocumentPtr other = _own[_random() % _own.size()];
        if (other == own || !other->isAt() || other->presence != Document::Presence::Certain)
          return;
        const std::string second = _run.drive.store() + other->places.front();
        if (renameat2(AT_FDCWD, path.c_str(), AT_FDCWD, second.c_str(), RENAME_EXCHANGE) != 0) {
          return;
        }
        std::swap(document.places, other->places);
        // Which of them has which identifier depends on their age.
        document.identifier.clear();
        other->identifier.clear();
      }
    }
    if (_random() % 2 == 0) expectListed(folderOf(document));
  }

  static bool renameNew(const std::string& from, const std::string& to) {
    return renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) == 0;
  }

  // A listing that begins now shows exactly the documents that are surely in a folder of its own.
  void expectListed(const std::string& folder) {
    std::set<std::string> certain;
    std::set<std::string> possible = {"inner"};
    for (const DocumentPtr& one : _run.everybody.all()) {
      if (!one->token.starts_with(_name + '-') || one->isShared) continue;
      for (const std::string& place : one->places) {
        if (fs::path(place).parent_path() != folder) continue;
        const std::string name = fs::path(place).filename();
        if (one->presence != Document::Presence::Gone) possible.insert(name);
        if (one->presence == Document::Presence::Certain && one->isAt()) certain.insert(name);
      }
      if (one->places.empty()) return;
    }
    const Asked asked = ask({"ls", folder});
    expectFound({"ls", folder}, asked);
    if (asked.answer != Answer::Done) return;
    std::set<std::string> listed;
    for (const std::string& name : asked.result.lines()) {
      EXPECT_TRUE(listed.insert(name).second) << name << " is listed twice";
      EXPECT_EQ(possible.count(name), 1U) << name << " is listed in " << folder;
    }
    for (const std::string& name : certain) {
      EXPECT_EQ(listed.count(name), 1U) << name << " is not listed in " << folder;
    }
  }

  // ---- what all share

  void changeShared() {
    const DocumentPtr document = _run.everybody.anyShared(_random);
    if (!document) return;
    const std::string& name = document->identifier;
    switch (_random() % 8) {
      case 0: ask({"mv", name, sharedFolder() + '/' + document->token + '-' + unique()}); break;
      case 1: ask({"mv", name, sharedFolder()}); break;
      case 2: ask({"trash", name}); break;
      case 3:
      case 4: ask({"restore", name}); break;
      case 5: {
        _run.everybody.note(document, Document::Presence::Uncertain);
        if (ask({"rm", name}, _random() % 4 == 0).answer == Answer::Done) {
          _run.everybody.note(document, Document::Presence::Gone);
        }
        break;
      }
      case 6: {  // another program, by whatever name it has
        const Asked asked = ask({"path", name});
        if (asked.answer != Answer::Done || !asked.result.output.starts_with("/shared")) return;
        ++_run.outside;
        renameNew(_run.drive.store() + asked.result.lines().front(),
                  _run.drive.store() + sharedFolder() + '/' + document->token + '-' + unique());
        break;
      }
      default: {
        const Asked asked = ask({"cat", name});
        if (asked.answer == Answer::Done) {
          EXPECT_EQ(asked.result.output, document->texts.front());
        }
      }
    }
  }

  // ---- what changes no name

  void mark(const DocumentPtr& own) {
    const std::string name = nameOf(*own);
    if (name.empty() || own->presence != Document::Presence::Certain) return;
    Arguments arguments;
    switch (_random() % 6) {
      case 0: arguments = {"tag", name, "--add", own->token + '-' + unique()}; break;
      case 1: arguments = {"favorite", name}; break;
      case 2: arguments = {"touch-used", name}; break;
      case 3: arguments = {"share", "create", name, "--title", own->token}; break;
      case 4: arguments = {"share", "remove", name}; break;
      default: arguments = {"share", "url", name};
    }
    expectFound(arguments, ask(arguments));
  }

  void look(const DocumentPtr& own) {
    Document& document = *own;
    const std::string name = nameOf(document);
    if (name.empty() || document.presence != Document::Presence::Certain) return;
    if (_random() % 2 == 0) {
      const Asked asked = ask({"cat", name});
      expectFound({"cat", name}, asked);
      if (asked.answer == Answer::Done) {
        EXPECT_EQ(asked.result.output, document.texts.front());
      }
      return;
    }
    const Asked asked = ask({"stat", "--json", name});
    expectFound({"stat", name}, asked);
    if (asked.answer != Answer::Done) return;
    const Json answer = answerOf(asked.result);
    settle(document, answer);
    _run.everybody.publish(document.identifier);
    if (document.isAt()) {
      EXPECT_EQ(answer.value("path", ""), document.places.front());
    }
  }

  // Questions, and what anybody may do to any document.
  void askAnything() {
    const std::string name = _run.everybody.anyIdentifier(_random);
    if (name.empty()) return;
    switch (_random() % 26) {
      case 0:
      case 1:
      case 2:
      case 3: ask({"evict", name}); break;
      case 4:
      case 5: ask({"get", name}, _random() % 4 == 0); break;
      case 6: ask({"get", "--pin", name}); break;
      case 7: ask({"evict", "--unpin", name}); break;
      case 8: ask({"thumb", name}); break;
      case 9: ask({"why", name}); break;
      case 10: ask({"share", "info", name}); break;
      case 11: ask({"collab", "token", name}); break;
      case 12: ask({"ls", "-R", "/"}); break;
      case 13: ask({"trash", "list"}); break;
      case 14: ask({"tag", "--list"}); break;
      case 15: ask({"cloud", "gc"}); break;
      case 16: ask({"cloud"}); break;
      case 17: ask({"status"}); break;
      case 18: ask({"drives"}); break;
      case 19: ask({"changes", "--since", "initial"}); break;
      case 20: ask({"doctor", "--quick"}); break;
      case 21: ask({"mkdir", sharedFolder() + '/' + _name + '-' + unique()}); break;
      case 22: ask({"alias", name, sharedFolder() + "/alias-" + _name + '-' + unique()}); break;
      case 23: ask({"log"}); break;
      default:  // whoever watches may be killed as well
        _watches.push_back(_run.drive.start({"watch", "/shared" + std::to_string(_random() % 3)}));
        if (_watches.size() > 2) _watches.erase(_watches.begin());
    }
  }

  std::string unique() { return std::to_string(++_count); }
  const std::string& folder() { return _folders[_random() % _folders.size()]; }
  std::string sharedFolder() { return "/shared" + std::to_string(_random() % 3); }

  Work& _run;
  const std::string _name;
  std::mt19937 _random;
  const std::vector<std::string> _folders;
  std::uint64_t _count = 0;
  std::vector<DocumentPtr> _own;
  std::vector<std::unique_ptr<Process>> _watches;
};

struct Processes {
  pid_t daemon = 0;
  pid_t host = 0;
  std::uint64_t daemonKilobytes = 0;
  std::uint64_t hostKilobytes = 0;
};

std::uint64_t residentKilobytes(pid_t process) {
  std::ifstream status("/proc/" + std::to_string(process) + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("VmRSS:")) return std::stoull(line.substr(6));
  }
  return 0;
}

Processes processesOf(const Drive& drive) {
  EXPECT_EQ(drive.run({"status"}).code, 0);
  const pid_t daemon = drive.daemon();
  const pid_t host = drive.host();
  return {daemon, host, residentKilobytes(daemon), residentKilobytes(host)};
}

// Kills vald and skein-host in turn, in the first three quarters of the time, and lets the rest
// pass; answers the two that are left after the last kill.
Processes killNowAndThen(Work& run, Clock::duration duration) {
  Mutex mutex;
  CondVar time;  // passes; nobody notifies it
  MutexLock lock(mutex);
  const auto begin = Clock::now();
  const auto waitUntil = [&](Clock::time_point moment) SKEIN_REQUIRES(mutex) {
    while (Clock::now() < moment) time.waitUntil(mutex, moment);
  };
  for (int number = 0; number < kKills && !testing::Test::HasFailure();) {
    waitUntil(std::max(begin + duration * 3 * (number + 1) / (4 * kKills), Clock::now() + 10ms));
    const pid_t victim = number % 2 == 0 ? run.drive.daemon() : run.drive.host();
    ++run.kills;
    if (victim > 0 && kill(victim, SIGKILL) == 0 && waitUntilGone(victim, 5s)) ++number;
    ++run.kills;
  }
  const Processes left = processesOf(run.drive);
  waitUntil(std::max(begin + duration, Clock::now() + duration / 8));
  run.isOver = true;
  return left;
}

// Nobody died by itself, and memory is flat.
void expectSameProcesses(const Drive& drive, const Processes& before) {
  const Processes now = processesOf(drive);
  EXPECT_EQ(now.daemon, before.daemon);
  EXPECT_EQ(now.host, before.host);
  std::cout << "memory of vald " << before.daemonKilobytes << " to " << now.daemonKilobytes
            << " kB, of skein-host " << before.hostKilobytes << " to " << now.hostKilobytes
            << " kB\n";
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__) && !defined(__clang__)
  constexpr std::uint64_t kWhatGrowsAtFirst = 24 << 10;
  EXPECT_LE(now.daemonKilobytes, before.daemonKilobytes * 5 / 4 + kWhatGrowsAtFirst);
  EXPECT_LE(now.hostKilobytes, before.hostKilobytes * 5 / 4 + kWhatGrowsAtFirst);
#endif
}

// ---- in the end

// What the two processes hold; the same for a drive that just opened, where nothing leaked.
struct Held {
  Json status;
  std::size_t daemonDescriptors = 0;
  std::size_t hostDescriptors = 0;
};

std::size_t countIn(const std::string& folder) {
  const fs::directory_iterator entries(folder);
  return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

Held heldBy(const Drive& drive) {
  Held held;
  const auto deadline = Clock::now() + 60s;
  do {
    held.status = answerOf(drive.run({"status", "--json"}));
  } while ((held.status.value("scan", "") != "idle" || held.status.value("senders", 1) != 0 ||
            held.status.value("watchedContainers", 1) != 0) &&
           Clock::now() < deadline);
  held.daemonDescriptors = countIn("/proc/" + std::to_string(drive.daemon()) + "/fd");
  held.hostDescriptors = countIn("/proc/" + std::to_string(drive.host()) + "/fd");
  return held;
}

void expectNothingLeaked(const Drive& drive) {
  const Held worked = heldBy(drive);
  EXPECT_EQ(worked.status.value("senders", -1), 0) << worked.status;
  EXPECT_EQ(worked.status.value("watchedContainers", -1), 0) << worked.status;
  EXPECT_EQ(drive.run({"stop"}).code, 0);
  EXPECT_EQ(drive.run({"ls", "-R", "/"}).code, 0);
  const Held fresh = heldBy(drive);
  // Connections of the index's readers, of which a drive that just opened has one.
  constexpr std::size_t kReaders = 16;
  EXPECT_LE(worked.daemonDescriptors, fresh.daemonDescriptors + kReaders);
  EXPECT_LE(worked.hostDescriptors, fresh.hostDescriptors + kReaders);
  EXPECT_EQ(worked.status.value("watches", -1), fresh.status.value("watches", -2));
  std::cout << "descriptors of vald " << worked.daemonDescriptors << ", of a fresh one "
            << fresh.daemonDescriptors << "; of skein-host " << worked.hostDescriptors << " and "
            << fresh.hostDescriptors << "; watches " << worked.status.value("watches", -1) << '\n';
}

// One that is listed, or in the trash.
struct Present {
  Json item;
  std::string place;
  std::string text;
};

std::vector<Present> presentDocuments(const Drive& drive) {
  std::vector<Present> present;
  Arguments evicted = {"get"};
  for (const bool inTrash : {false, true}) {
    const Result result = drive.run(inTrash ? Arguments{"trash", "list", "--json"}
                                            : Arguments{"ls", "-R", "--json", "/"});
    EXPECT_EQ(result.code, 0) << result.errors;
    for (const std::string& line : result.lines()) {
      const Json item = Json::parse(line);
      if (item["kind"] != "document") continue;
      present.push_back({item, inTrash ? kTrash : item["path"], {}});
      if (!item["downloaded"]) evicted.push_back(item["id"]);
    }
  }
  std::cout << present.size() << " documents, " << evicted.size() - 1 << " of them evicted\n";
  if (evicted.size() > 1) {
    const Result got = drive.run(evicted);
    EXPECT_EQ(got.code, 0) << got.errors;
  }
  for (Present& one : present) {
    const auto text = contentsOf(drive.store() + one.item["path"].get<std::string>());
    EXPECT_TRUE(text.has_value()) << one.item;
    one.text = text.value_or("");
  }
  return present;
}

void compare(const Work& run) {
  std::map<std::string, DocumentPtr> missing;
  for (const DocumentPtr& document : run.everybody.all()) missing[document->token] = document;
  for (const Present& present : presentDocuments(run.drive)) {
    const std::string token = present.text.substr(0, present.text.find('\n'));
    const auto found = missing.find(token);
    if (found == missing.end()) {
      ADD_FAILURE() << "there twice, or nobody's: " << present.item << " with \"" << token << '"';
      continue;
    }
    const Document& document = *found->second;
    EXPECT_NE(document.presence, Document::Presence::Gone) << "was removed: " << present.item;
    EXPECT_EQ(std::count(document.texts.begin(), document.texts.end(), present.text), 1)
        << "other contents: " << present.item << '\n'
        << present.text.substr(0, 60);
    if (document.isNamed()) {
      EXPECT_EQ(present.item["id"], document.identifier) << token;
    }
    if (!document.places.empty()) {
      EXPECT_EQ(std::count(document.places.begin(), document.places.end(), present.place), 1)
          << "elsewhere: " << present.item << ", not at " << document.places.front();
    }
    for (const std::string tag : present.item["tags"]) {
      EXPECT_TRUE(tag.starts_with(token + '-')) << "another's tag: " << present.item;
    }
    missing.erase(found);
  }
  for (const auto& [token, document] : missing) {
    EXPECT_NE(document->presence, Document::Presence::Certain)
        << "nobody removed " << token << ", " << document->identifier << ", at "
        << (document->places.empty() ? "any place" : document->places.front());
  }
}

// What a log has of faults, and what operations leave behind when they are not finished.
void expectNothingBroken(const Drive& drive) {
  for (const auto& entry : fs::recursive_directory_iterator(drive.state())) {
    if (entry.path().string().find(".log") == std::string::npos) continue;
    std::istringstream lines(contentsOf(entry.path()).value_or(""));
    for (std::string line; std::getline(lines, line);) {
      const bool isFault =
          line.find(" CRIT ") != std::string::npos || line.find("Sanitizer") != std::string::npos;
      EXPECT_FALSE(isFault) << entry.path() << ": " << line;
    }
  }
  for (const auto& entry : fs::recursive_directory_iterator(drive.store())) {
    const std::string name = entry.path().filename();
    EXPECT_FALSE(name.ends_with(".skein-part") || name.ends_with(".skein-old")) << entry.path();
  }
}

unsigned numberFrom(const char* variable, unsigned otherwise) {
  const char* text = std::getenv(variable);
  return text == nullptr ? otherwise : static_cast<unsigned>(std::strtoul(text, nullptr, 10));
}

TEST(Soak, WhatEverybodyDoesAtOnceIsDoneToWhatWasNamedAndToNothingElse) {
  const unsigned seconds = numberFrom("SKEIN_SOAK", 0);
  if (seconds == 0) GTEST_SKIP() << "asked for by SKEIN_SOAK=SECONDS";
  Drive drive;
  Work run{drive, numberFrom("SKEIN_SEED", std::random_device()()), {}, {}, {}, {}, {}, {}, {}};
  std::cout << "SKEIN_SEED=" << run.seed << std::endl;
  for (int number = 0; number < 3; ++number) {
    fs::create_directory(drive.store() + "/shared" + std::to_string(number));
  }
  ASSERT_EQ(drive.run({"status"}).code, 0);
  Processes left;
  {
    std::vector<std::jthread> threads;
    for (int number = 0; number < kClients; ++number) {
      threads.emplace_back([&run, number] { Client(run, number).work(); });
    }
    left = killNowAndThen(run, std::chrono::seconds(seconds));
  }
  std::cout << run.commands << " commands, " << run.failed << " failed, " << run.uncertain
            << " of unknown outcome; " << run.outside << " changes by other programs; " << kKills
            << " kills\n";
  EXPECT_GT(run.commands, static_cast<std::uint64_t>(kClients));

  expectSameProcesses(drive, left);
  const Result doctor = drive.run({"doctor"});
  EXPECT_EQ(doctor.code, 0) << doctor.output << doctor.errors;
  compare(run);
  expectNothingBroken(drive);
  expectNothingLeaked(drive);
}

}  // namespace
}  // namespace skein
