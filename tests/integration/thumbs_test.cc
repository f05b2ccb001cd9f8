// skein thumb, with the real programs.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <nlohmann/json.hpp>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

constexpr char kPicture[] = "\x89PNG\r\n\x1a\n and the rest";

// An app with a container of its own, and an icon in a file.
void installApp(const Drive& drive, const std::string& picture = kPicture) {
  const std::filesystem::path data = std::filesystem::path(drive.store()).parent_path() / "data";
  std::filesystem::create_directories(data / "applications");
  std::ofstream(data / "app.png") << picture;
  std::ofstream(data / "applications/org.example.App.desktop")
      << "[Desktop Entry]\nType=Application\nName=App\nIcon=" << (data / "app.png").native()
      << "\nX-Skein-Containers=org.example.App\nX-Skein-Undecorated=true\n";
}

TEST(Thumb, TellsOfEachItemAndWritesWhatThereIs) {
  Drive drive;
  installApp(drive);
  std::filesystem::create_directory(drive.store() + "/folder");
  drive.write("/note.txt", "note");
  const std::string pictures = drive.store() + "/../pictures";

  const Result result = drive.run(
      {"thumb", "--json", "-o", pictures, "/folder", "/App", "/note.txt", "/gone", "/App"});
  EXPECT_EQ(result.code, 3) << result.errors;
  std::map<std::string, nlohmann::json> told;
  for (const std::string& line : result.lines()) {
    const auto json = nlohmann::json::parse(line);
    told[json["given"]] = json;
  }
  EXPECT_EQ(result.lines().size(), 5U);
  EXPECT_EQ(told["/folder"]["result"], "none");
  EXPECT_EQ(told["/gone"]["result"], "error");
  EXPECT_EQ(told["/gone"]["exitCode"], 3);
  // Uploaded by now or not: there is no picture of it either way.
  const std::string note = told["/note.txt"]["result"];
  EXPECT_TRUE(note == "none" || note == "missing") << note;
  EXPECT_EQ(told["/App"]["result"], "icon");
  EXPECT_EQ(told["/App"]["bytes"], sizeof kPicture - 1);
  EXPECT_EQ(told["/App"]["type"], "image/png");
  EXPECT_EQ(told["/App"]["contentType"], "com.tessel.fileprovider.vl-undecorated-container");
  for (const char* name : {"/App.png", "/App (2).png"}) {
    EXPECT_EQ(std::filesystem::file_size(pictures + name), sizeof kPicture - 1) << name;
  }

  // Off a terminal that shows pictures there is nowhere to put them.
  EXPECT_EQ(drive.run({"thumb", "/App"}).code, 2);
}

// More than one message holds, and more than waits to be taken.
TEST(Thumb, LargePicturesComeHoweverOftenTheyAreNamed) {
  constexpr std::size_t kSize = 3'000'000;
  Drive drive;
  installApp(drive, kPicture + std::string(kSize - (sizeof kPicture - 1), 'p'));
  Arguments arguments{"thumb", "--json"};
  arguments.insert(arguments.end(), 12, "/App");
  const Result result = drive.run(arguments);
  EXPECT_EQ(result.code, 0) << result.errors;
  const auto lines = result.lines();
  ASSERT_EQ(lines.size(), 12U);
  for (const std::string& line : lines) EXPECT_EQ(nlohmann::json::parse(line)["bytes"], kSize);
}

}  // namespace
}  // namespace skein
