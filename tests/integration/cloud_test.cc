// The local cloud as a person looks at it and tries it out, with the real programs.
#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <nlohmann/json.hpp>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;
using Json = nlohmann::json;

class CloudTrial : public testing::Test {
 protected:
  Json json(const Arguments& arguments) {
    const Result result = drive.run(arguments);
    EXPECT_EQ(result.code, 0) << result.errors;
    return Json::parse(result.output, nullptr, false);
  }
  Json cloud() { return json({"cloud", "--json"}); }
  void tryOut(const Arguments& conditions) {
    Arguments arguments{"cloud", "try"};
    arguments.insert(arguments.end(), conditions.begin(), conditions.end());
    const Result result = drive.run(arguments);
    EXPECT_EQ(result.code, 0) << result.errors;
  }
  int fails(const Arguments& arguments, const std::string& reason) {
    const Result result = drive.run(arguments);
    EXPECT_NE(result.errors.find(reason), std::string::npos) << result.errors;
    return result.code;
  }
  // For what vald does by itself some time later. Each look is a program of its own.
  static bool comesTrue(const std::function<bool()>& condition) {
    const auto deadline = std::chrono::steady_clock::now() + 30s;
    while (!condition()) {
      if (std::chrono::steady_clock::now() > deadline) return false;
    }
    return true;
  }
  bool isUploaded(const std::string& path) {
    return comesTrue([&] { return json({"stat", "--json", path}).value("uploaded", false); });
  }
  // What there is of the letter: itself, its marker, a part of it.
  std::size_t files() const {
    std::size_t count = 0;
    for (const auto& entry : fs::directory_iterator(drive.store())) {
      if (entry.path().filename().string().find("letter") != std::string::npos) ++count;
    }
    return count;
  }

  Drive drive;
};

TEST_F(CloudTrial, DownloadsFailClearlyAndLeaveNothing) {
  const std::string text(1 << 20, 'w');
  const std::string file = drive.store() + "/letter.txt";
  drive.write("/letter.txt", text);
  ASSERT_TRUE(isUploaded("/letter.txt"));
  // A tag does not make it less uploaded.
  EXPECT_EQ(drive.run({"tag", "/letter.txt", "--add", "work"}).code, 0);
  EXPECT_EQ(drive.run({"evict", "/letter.txt"}).code, 0);
  EXPECT_EQ(cloud()["usedBytes"], 1 << 20);
  EXPECT_EQ(files(), 1u);

  tryOut({"--offline"});
  EXPECT_EQ(fails({"get", "/letter.txt"}, "cannot be reached"), 5);
  EXPECT_NE(drive.run({"status"}).output.find("offline"), std::string::npos);

  tryOut({"--corrupt", "--delay", "1"});
  EXPECT_EQ(fails({"get", "/letter.txt"}, "other contents"), 1);
  EXPECT_EQ(files(), 1u);

  // Interrupted among its bytes, and long before the first of them.
  for (const Arguments& slowness : {Arguments{"--bandwidth", "1K"}, {"--delay", "60000"}}) {
    tryOut(slowness);
    const auto slow = drive.start({"get", "/letter.txt"});
    ASSERT_TRUE(comesTrue([&] { return files() == 2; }));
    sendSignal(slow->pid(), SIGINT);
    EXPECT_EQ(slow->finish(10s), 130);
    EXPECT_TRUE(comesTrue([&] { return files() == 1; })) << slowness[0];
  }
  EXPECT_EQ(cloud()["conditions"]["delayMilliseconds"], 60000);
  EXPECT_FALSE(cloud()["conditions"]["corrupt"]);

  tryOut({"--failures", "1"});
  EXPECT_EQ(fails({"get", "/letter.txt"}, "cannot be reached"), 5);
  EXPECT_EQ(drive.run({"get", "/letter.txt"}).code, 0);
  std::ifstream back(file, std::ios::binary);
  EXPECT_TRUE(std::string(std::istreambuf_iterator<char>(back), {}) == text);
}

TEST_F(CloudTrial, AFullCloudIsToldOfAndUploadsGoOnWhenThereIsRoom) {
  EXPECT_EQ(drive.run({"cloud", "try"}).code, 2);
  tryOut({"--quota", "2"});
  drive.write("/letter.txt", "dear");
  ASSERT_TRUE(comesTrue([&] { return cloud()["failed"] == 1; }));
  EXPECT_EQ(fails({"evict", "/letter.txt"}, "not uploaded"), 8);
  const std::string shown = drive.run({"cloud"}).output;
  EXPECT_NE(shown.find("The cloud is full"), std::string::npos) << shown;
  tryOut({"--reset"});
  EXPECT_TRUE(isUploaded("/letter.txt"));
  EXPECT_EQ(cloud()["conditions"]["quota"], nullptr);

  EXPECT_EQ(drive.run({"stop"}).code, 0);
  const Result refused = drive.shell("env -u SKEIN_ALLOW_FAULTS skein cloud try --offline");
  EXPECT_EQ(refused.code, 1);
  EXPECT_NE(refused.errors.find("stop the drive"), std::string::npos) << refused.errors;
  EXPECT_NE(refused.errors.find("SKEIN_ALLOW_FAULTS=1"), std::string::npos) << refused.errors;
}

TEST_F(CloudTrial, OldRevisionsAndRemovedDocumentsAreKeptByARuleAndThenGo) {
  // What the contents in the cloud take.
  const auto room = [&] {
    std::uintmax_t bytes = 0;
    std::error_code failure;
    const fs::path data = fs::path(drive.state()).parent_path() / "data/skein";
    for (const auto& one : fs::directory_iterator(data, failure)) {
      for (const auto& entry :
           fs::recursive_directory_iterator(one.path() / "cloud/objects", failure)) {
        if (entry.is_regular_file()) bytes += entry.file_size();
      }
    }
    return bytes;
  };
  constexpr std::size_t kSize = 300'000;
  EXPECT_EQ(cloud()["keptBytes"], 0);
  for (const char* words : {"1", "2", "3"}) {
    drive.write("/letter.txt", std::string(kSize, *words));
    ASSERT_TRUE(comesTrue([&] { return room() == kSize * (*words - '0'); }));
    ASSERT_TRUE(comesTrue([&] { return cloud()["keptBytes"] == kSize * (*words - '1'); }));
    ASSERT_TRUE(isUploaded("/letter.txt"));
  }
  EXPECT_EQ(json({"cloud", "gc", "--json"})["freedFiles"], 0);
  const std::string shown = drive.run({"cloud"}).output;
  EXPECT_NE(shown.find("30 days"), std::string::npos) << shown;
  EXPECT_NE(shown.find("10 % of the disk"), std::string::npos) << shown;

  EXPECT_EQ(drive.run({"cloud", "keep"}).code, 2);
  EXPECT_EQ(drive.run({"cloud", "keep", "--percent", "101"}).code, 2);
  EXPECT_EQ(drive.run({"cloud", "keep", "--days", "0"}).code, 0);
  EXPECT_EQ(cloud()["keepDays"], 0);
  EXPECT_EQ(cloud()["keepPercent"], 10);
  const Result freed = drive.run({"cloud", "gc"});
  EXPECT_EQ(freed.output, "freed 2, 600.0 kB; kept 0, 0 bytes\n") << freed.errors;
  EXPECT_EQ(room(), kSize);

  // An evicted document's contents outlive a marker that is away for a while.
  ASSERT_TRUE(isUploaded("/letter.txt"));
  EXPECT_EQ(drive.run({"evict", "/letter.txt"}).code, 0);
  const fs::path marker = fs::path(drive.store()) / ".letter.txt.skein";
  const fs::path away = fs::path(drive.store()).parent_path() / "away";
  fs::rename(marker, away);
  ASSERT_TRUE(comesTrue([&] { return cloud()["onlyCopiesBytes"] == kSize; }));
  EXPECT_EQ(json({"cloud", "gc", "--json"})["freedFiles"], 0);
  fs::rename(away, marker);
  ASSERT_TRUE(comesTrue([&] { return drive.run({"get", "/letter.txt"}).code == 0; }));
  EXPECT_EQ(drive.run({"cat", "/letter.txt"}).output, std::string(kSize, '3'));
}

TEST_F(CloudTrial, DoctorNamesWhatCannotComeBack) {
  drive.write("/letter.txt", "dear");
  drive.write("/other.txt", "others");
  fs::create_directory(drive.store() + "/folder");
  drive.write("/folder/whole.txt", "whole");
  for (const char* path : {"/letter.txt", "/other.txt", "/folder/whole.txt"}) {
    ASSERT_TRUE(isUploaded(path));
    EXPECT_EQ(drive.run({"evict", path}).code, 0);
  }
  EXPECT_EQ(drive.run({"trash", "/other.txt"}).code, 0);
  const Result whole = drive.run({"doctor"});
  EXPECT_EQ(whole.code, 0) << whole.output;
  EXPECT_NE(whole.output.find("3 evicted looked at in the cloud (15 bytes read): no difference"),
            std::string::npos)
      << whole.output;

  // All but the whole one are spoiled, with as many bytes as before.
  const fs::path data = fs::path(drive.state()).parent_path() / "data/skein";
  for (const auto& entry : fs::recursive_directory_iterator(data)) {
    const bool isObject = entry.path().string().find("/cloud/objects/") != std::string::npos;
    if (!isObject || !entry.is_regular_file() || entry.file_size() == 5) continue;
    fs::permissions(entry.path(), fs::perms::owner_all);
    const std::string spoiled(entry.file_size(), 'x');
    std::ofstream(entry.path()) << spoiled;
  }
  EXPECT_EQ(drive.run({"doctor", "--quick"}).code, 0);
  std::ofstream(drive.store() + "/.left.txt.skein-old") << "set aside";
  const Result spoiled = drive.run({"doctor"});
  EXPECT_EQ(spoiled.code, 1);
  for (const char* told :
       {"cannot come back  ", "/letter.txt: its contents in the cloud are damaged",
        "/other.txt: its contents in the cloud are damaged",
        "/.left.txt.skein-old: ", "3 differences"}) {
    EXPECT_NE(spoiled.output.find(told), std::string::npos) << told << " in " << spoiled.output;
  }
}

}  // namespace
}  // namespace skein
