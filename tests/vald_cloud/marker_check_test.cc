// Whether what is evicted can come back.
#include <fstream>

#include "linux/vald/cloud/MarkerCheck.h"
#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

namespace fs = std::filesystem;

class Unhindered final : public StreamObserver {
 public:
  NSErrorPtr didPass(std::uint64_t) override { return nullptr; }
};

class MarkerCheckTest : public testing::Test {
 protected:
  // "" when it can come back, else why not.
  std::string fault(bool quick) {
    Unhindered observer;
    const auto lost = checkMarker(rig.places(), marker.string(), quick, observer);
    if (!lost) return "";
    EXPECT_TRUE(lost->path == path || lost->path == marker) << lost->path;
    return lost->why;
  }
  void expectFault(const std::string& words) {
    for (const bool quick : {false, true}) {
      EXPECT_NE(fault(quick).find(words), std::string::npos) << quick << ": " << fault(quick);
    }
  }

  TemporaryFolder folder;
  CloudRig rig{folder.path()};
  const VLFileObjectID document = documentNumber(3);
  const std::string path = rig.write("a", "words");
  const fs::path marker = rig.top / "drive/.a.skein";
};

TEST_F(MarkerCheckTest, WhatIsLostDamagedOrForgedIsNamed) {
  EXPECT_EQ(fault(false), "");  // there is no marker
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(document, path)));
  ASSERT_EQ(brief(rig.evict(document, path)), "none");
  EXPECT_EQ(fault(false), "");
  EXPECT_EQ(fault(true), "");

  const std::string hash = (*rig.records->record(document))->contents.hash.asString();
  const fs::path object = rig.top / "cloud/objects" / hash.substr(0, 2) / hash;
  fs::permissions(object, fs::perms::owner_all);
  std::ofstream(object) << "wordz";
  EXPECT_EQ(fault(true), "");  // that is not read
  EXPECT_EQ(fault(false), "its contents in the cloud are damaged");
  std::ofstream(object) << "longer words";
  expectFault("no contents of its 5 bytes");
  fs::remove(object);
  expectFault("no contents of its 5 bytes");

  const std::string text = contentsOf(marker);
  ASSERT_EQ(brief(rig.records->remove(document)), "none");
  std::ofstream(marker) << text.substr(0, text.find("seal")) << "end\n";
  expectFault("was not made by this drive's cloud");
  std::ofstream(marker) << text.substr(0, text.size() / 2);
  expectFault("damaged");
  std::ofstream(marker) << "somebody's own file";
  EXPECT_EQ(fault(false), "");
}

}  // namespace
}  // namespace skein::vald
