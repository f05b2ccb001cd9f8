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

}  // namespace
}  // namespace skein
