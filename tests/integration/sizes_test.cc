// Answers as large as names, tags and pictures make them, with the real programs.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

using namespace std::chrono_literals;

std::string longName(int number) {
  const std::string digits = std::to_string(1000 + number);
  return digits + std::string(255 - digits.size(), 'n');
}

TEST(Sizes, AFolderOfLongNamesAndManyTagsIsListedWatchedAndThrownAway) {
  constexpr int kFiles = 200;
  Drive drive;
  std::filesystem::create_directory(drive.store() + "/folder");
  Arguments tag{"tag"};
  for (char letter = 'a'; letter <= 'c'; ++letter) {
    // About what fits beside a file of ext4.
    tag.insert(tag.end(), {"--add", std::string(1200, letter)});
  }
  for (int number = 0; number < kFiles; ++number) {
    drive.write("/folder/" + longName(number), "x");
    tag.push_back("/folder/" + longName(number));
  }
  const auto watch = drive.start({"watch", "--json", "/folder", "--ready-fd", "1"});
  ASSERT_EQ(watch->readLine(20s), "ready") << watch->errors;
  const Result tagged = drive.run(tag);
  ASSERT_EQ(tagged.code, 0) << tagged.errors;

  const Result listed = drive.run({"ls", "--json", "/folder"});
  EXPECT_EQ(listed.code, 0) << listed.errors;
  EXPECT_EQ(listed.lines().size(), kFiles);
  EXPECT_GT(listed.output.size(), std::size_t{kFiles} * 3600);
  std::size_t heard = 0;
  for (; heard < kFiles && watch->readLine(20s); ++heard) {
  }
  EXPECT_EQ(heard, kFiles);

  // Named by a path that is longer than any there can be.
  std::string deep = "/folder";
  while (deep.size() < 100'000) deep += "/d";
  const Result why = drive.run({"why", deep});
  EXPECT_EQ(why.code, 3) << why.errors;

  Arguments trash{"trash"};
  for (int number = 0; number < kFiles; ++number) trash.push_back("/folder/" + longName(number));
  EXPECT_EQ(drive.run(trash).code, 0);
  const Result thrown = drive.run({"trash", "list", "--json"});
  EXPECT_EQ(thrown.code, 0) << thrown.errors;
  EXPECT_EQ(thrown.lines().size(), kFiles);
  const Result doctor = drive.run({"doctor"});
  EXPECT_EQ(doctor.code, 0) << doctor.output << doctor.errors;
}

}  // namespace
}  // namespace skein
