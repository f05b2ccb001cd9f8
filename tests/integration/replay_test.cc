// Whatever happens to the store, to vald and to the host: replaying the working set's
// changes from any token gives what a full listing gives, and a document that survives
// keeps its identifier. SKEIN_LONG=1 makes 10,000 operations of it.
#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <nlohmann/json.hpp>
#include <random>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;
using Json = nlohmann::json;

constexpr char kRoot[] = "NSFileProviderRootContainerItemIdentifier";

// What a consumer of the working set knows, and the token it goes on from.
struct Consumer {
  struct Known {
    std::string parent;
    std::string name;
  };
  std::string token = "initial";
  std::map<std::string, Known> items;

  // False when the command failed; then nothing was taken over.
  bool apply(const Result& result) {
    if (result.code != 0) return false;
    for (const std::string& line : result.lines()) {
      const Json change = Json::parse(line);
      if (change.contains("token")) {
        token = change["token"];
      } else if (change["change"] == "deleted") {
        items.erase(change["id"].get<std::string>());
      } else {
        items[change["id"]] = {change["parent"], change["name"]};
      }
    }
    return true;
  }

  // Identifier by path. A folder's path is its parents' names.
  std::map<std::string, std::string> paths() const {
    std::map<std::string, std::string> paths;
    for (const auto& [id, known] : items) {
      if (id == kRoot) continue;
      std::string path = "/" + known.name;
      std::string parent = known.parent;
      while (parent != kRoot) {
        const auto found = items.find(parent);
        if (found == items.end()) {
          path = "(no parent " + parent + ")" + path;
          break;
        }
        path = "/" + found->second.name + path;
        parent = found->second.parent;
      }
      paths[path] = id;
    }
    return paths;
  }
};

// A store that somebody works in, and what must come of it.
class Work {
 public:
  explicit Work(const Drive& drive) : _top(drive.store()) { _folders.push_back(""); }

  // One random operation. A document is touched once between two settled states: what two
  // replacements of one file amount to is not to be told from outside.
  void perform() {
    const unsigned kind = pick(10);
    if (kind < 3 || _documents.size() < 5) {
      const std::string path = folder() + fresh("/file");
      write(path);
      _documents.push_back({path, "", true});
    } else if (kind == 3) {
      const std::string path = folder() + fresh("/folder");
      fs::create_directory(_top + path);
      _folders.push_back(path);
    } else if (Document* document = untouched()) {
      document->touched = true;
      if (kind < 6) {
        const std::string path = folder() + fresh("/moved");
        fs::rename(_top + document->path, _top + path);
        document->path = path;
      } else if (kind < 8) {
        const std::string temporary = document->path + ".tmp";
        write(temporary);
        fs::rename(_top + temporary, _top + document->path);
      } else if (kind == 8) {
        write(document->path);
      } else {
        fs::remove(_top + document->path);
        document->path.clear();
      }
    }
  }

  // Everything there is, as paths from the drive's root.
  std::vector<std::string> paths() const {
    std::vector<std::string> paths;
    for (const auto& entry : fs::recursive_directory_iterator(_top)) {
      paths.push_back(entry.path().string().substr(_top.size()));
    }
    std::sort(paths.begin(), paths.end());
    return paths;
  }

  // Checks that each document has the identifier it had, and notes those of new ones.
  void settled(const std::map<std::string, std::string>& identifiers) {
    std::erase_if(_documents, [](const Document& document) { return document.path.empty(); });
    for (Document& document : _documents) {
      const std::string& now = identifiers.at(document.path);
      if (document.identifier.empty()) {
        document.identifier = now;
      } else {
        EXPECT_EQ(now, document.identifier) << document.path;
      }
      document.touched = false;
    }
  }

  unsigned pick(unsigned count) {
    return static_cast<unsigned>(std::uniform_int_distribution<unsigned>(0, count - 1)(_random));
  }

 private:
  struct Document {
    std::string path;  // empty: deleted
    std::string identifier;
    bool touched = false;
  };

  std::string fresh(const char* stem) { return stem + std::to_string(++_count); }
  const std::string& folder() { return _folders[pick(static_cast<unsigned>(_folders.size()))]; }
  void write(const std::string& path) {
    std::ofstream(_top + path) << "contents " << ++_count << std::string(pick(2000), '.');
  }
  Document* untouched() {
    for (int tries = 0; tries < 20; ++tries) {
      Document& document = _documents[pick(static_cast<unsigned>(_documents.size()))];
      if (!document.touched && !document.path.empty()) return &document;
    }
    return nullptr;
  }

  const std::string _top;
  std::mt19937 _random{20240229};
  std::uint64_t _count = 0;
  std::vector<std::string> _folders;
  std::vector<Document> _documents;
};

std::map<std::string, std::string> listing(const Drive& drive) {
  std::map<std::string, std::string> paths;
  const Result result = drive.run({"ls", "-R", "--json", "/"});
  EXPECT_EQ(result.code, 0) << result.errors;
  for (const std::string& line : result.lines()) {
    const Json item = Json::parse(line);
    paths[item["path"]] = item["id"];
  }
  return paths;
}

std::vector<std::string> keys(const std::map<std::string, std::string>& map) {
  std::vector<std::string> keys;
  for (const auto& [key, value] : map) keys.push_back(key);
  return keys;
}

TEST(Replay, FromAnyTokenEqualsTheListingWhateverIsKilled) {
  const bool isLong = std::getenv("SKEIN_LONG") != nullptr;
  const int rounds = isLong ? 100 : 4;
  const int operations = isLong ? 100 : 60;
  Drive drive;
  Work work(drive);
  Consumer eager;
  Consumer lazy;
  std::vector<Consumer> retained;  // with a token of a moment in the past each

  for (int round = 0; round < rounds; ++round) {
    const int killAt = static_cast<int>(work.pick(static_cast<unsigned>(operations)));
    for (int i = 0; i < operations; ++i) {
      work.perform();
      if (i == killAt / 2) {
        // Asked while something is killed: an answer counts whole or not at all.
        const auto asking = drive.start({"changes", "--since", eager.token, "--json"});
        const pid_t victim = round % 2 == 0 ? drive.daemon() : drive.host();
        if (victim > 0) kill(victim, SIGKILL);
        const int code = asking->finish(30s);
        eager.apply({code, asking->output, asking->errors, {}});
      }
      if (i == killAt && drive.daemon() > 0) kill(drive.daemon(), SIGKILL);
    }
    // What is on disk now is what everybody must come to agree on.
    const std::vector<std::string> expected = work.paths();
    const auto deadline = std::chrono::steady_clock::now() + 60s;
    while (keys(eager.paths()) != expected && std::chrono::steady_clock::now() < deadline) {
      eager.apply(drive.run({"changes", "--since", eager.token, "--json"}));
    }
    const auto listed = listing(drive);
    ASSERT_EQ(keys(listed), expected) << "round " << round;
    ASSERT_EQ(eager.paths(), listed) << "round " << round;
    work.settled(listed);
    if (round % 3 == 0) retained.push_back(eager);
    if (round % 4 == 3) {
      ASSERT_TRUE(lazy.apply(drive.run({"changes", "--since", lazy.token, "--json"})));
      ASSERT_EQ(lazy.paths(), listed) << "round " << round;
    }
  }

  const auto listed = listing(drive);
  for (Consumer& consumer : retained) {
    ASSERT_TRUE(consumer.apply(drive.run({"changes", "--since", consumer.token, "--json"})));
    EXPECT_EQ(consumer.paths(), listed);
  }
  EXPECT_EQ(drive.run({"doctor"}).code, 0);
}

}  // namespace
}  // namespace skein
