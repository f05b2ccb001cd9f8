// Out to the cloud and back: what may go, why something may not, what comes back.
#include <fcntl.h>
#include <sys/stat.h>

#include <fstream>

#include "linux/vald/cloud/CloudRecovery.h"
#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

const VLFileObjectID kDocument = documentNumber(0xfedcba9876543210);

class EvictionTest : public testing::Test {
 protected:
  std::string uploaded(const std::string& name, const std::string& text = "words") {
    const std::string path = rig.write(name, text);
    EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
    return path;
  }
  std::string refusal(const std::string& path) {
    const std::string before = portraitOf(path);
    const NSErrorPtr error = rig.evict(kDocument, path);
    EXPECT_EQ(portraitOf(path), before);
    if (error == nullptr) return "evicted";
    EXPECT_NE(error->localizedDescription(), "");
    return error->domain() == SkeinEvictionErrorDomain ? std::to_string(error->code())
                                                       : brief(error);
  }
  static std::string code(EvictionRefusal reason) {
    return std::to_string(static_cast<std::int64_t>(reason));
  }

  TemporaryFolder folder;
  CloudRig rig{folder.path()};
};

TEST_F(EvictionTest, AFileGoesAndComesBackWithAllItHas) {
  const std::string path = rig.write("letter.txt", "Dear all,\n");
  ASSERT_EQ(chmod(path.c_str(), 0640), 0);
  const timespec times[2] = {{1700000001, 5}, {1600000000, 123456789}};
  ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  setTags(path, "red,work");
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  const std::string before = portraitOf(path);

  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  EXPECT_EQ(rig.names(), std::vector<std::string>{".letter.txt.skein"});
  const std::string marker = (rig.top / "drive/.letter.txt.skein").string();
  const auto read = EvictionMarker::parse(contentsOf(marker));
  ASSERT_TRUE(read);
  EXPECT_EQ(read->document, kDocument);
  EXPECT_EQ(read->contents.size, 10u);
  EXPECT_EQ(read->mode, 0640u);
  EXPECT_EQ(read->type, "text/plain");
  EXPECT_EQ(UploadStamp::timeOf(read->modified).tv_nsec, 123456789);
  EXPECT_EQ(nameOfDocument(*read, ".letter.txt.skein"), "letter.txt");
  EXPECT_EQ(refusal(path), code(EvictionRefusal::AlreadyEvicted));

  setTags(marker, "blue");  // while it is away
  EXPECT_EQ(brief(rig.download(documentNumber(2), path)), "NSCocoaErrorDomain 4");
  ASSERT_EQ(brief(rig.download(kDocument, path)), "none");
  EXPECT_EQ(rig.names(), std::vector<std::string>{"letter.txt"});
  std::string expected = before;
  expected.replace(expected.find("red,work"), 8, "blue");
  EXPECT_EQ(portraitOf(path), expected);
  // It counts as uploaded at once, and a second request finds it there.
  EXPECT_EQ(brief(rig.download(kDocument, path)), "none");
  EXPECT_EQ(brief(rig.evict(kDocument, path)), "none");
}

TEST_F(EvictionTest, TagsThatChangedAfterTheUploadGoWithTheFile) {
  const std::string path = uploaded("a");
  setTags(path, "new");
  const std::string before = portraitOf(path);
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  ASSERT_EQ(brief(rig.download(kDocument, path)), "none");
  EXPECT_EQ(portraitOf(path), before);
}

TEST_F(EvictionTest, NamesOfEveryLengthAndByte) {
  const std::string odd = "a\n%b\xff é.txt";
  for (const std::string& name :
       {odd, std::string(240, 'x'), std::string(241, 'y'), "\xc3\xa9" + std::string(253, 'z'),
        // Cut within a character, were it cut at 200 bytes.
        std::string(199, 'w') + "\xc3\xa9" + std::string(50, 'w')}) {
    const std::string path = uploaded(name, name);
    ASSERT_EQ(brief(rig.evict(kDocument, path)), "none") << name;
    ASSERT_EQ(rig.names().size(), 1u);
    const std::string markerName = rig.names().front();
    EXPECT_TRUE(mayBeMarkerName(markerName));
    const auto marker =
        EvictionMarker::parse(contentsOf((rig.top / "drive" / markerName).string()));
    ASSERT_TRUE(marker);
    EXPECT_EQ(nameOfDocument(*marker, markerName), name);
    ASSERT_EQ(brief(rig.download(kDocument, path)), "none") << name;
    EXPECT_EQ(contentsOf(path), name);
    std::filesystem::remove(path);
  }
}

TEST_F(EvictionTest, WhatIsNotSafeStaysWithTheReason) {
  const std::string path = rig.write("a", "words");
  EXPECT_EQ(refusal(path), code(EvictionRefusal::NotUploaded));
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));

  ASSERT_EQ(brief(rig.records->setPinned(kDocument, true)), "none");
  EXPECT_EQ(refusal(path), code(EvictionRefusal::Pinned));
  ASSERT_EQ(brief(rig.records->setPinned(kDocument, false)), "none");

  {
    const std::ofstream writer(path, std::ios::app);
    EXPECT_EQ(refusal(path), code(EvictionRefusal::OpenForWriting));
  }
  const std::ifstream reader(path);  // who reads goes on reading

  // Other words of the same length, with the date put back.
  const auto date = std::filesystem::last_write_time(path);
  std::ofstream(path) << "sword";
  std::filesystem::last_write_time(path, date);
  EXPECT_EQ(refusal(path), code(EvictionRefusal::ChangedSinceUpload));
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));

  const std::string second = path + "-second";
  std::filesystem::create_hard_link(path, second);
  EXPECT_EQ(refusal(path), code(EvictionRefusal::SeveralNames));
  std::filesystem::remove(second);
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));

  for (const char* name : {".a.skein", ".a.skein-new", ".a.skein-old", ".a.skein-part"}) {
    const std::string other = rig.write(name, "somebody's own");
    EXPECT_EQ(refusal(path), code(EvictionRefusal::MarkerNameTaken)) << name;
    EXPECT_EQ(contentsOf(other), "somebody's own");
    std::filesystem::remove(other);
  }
  // What takes the place of the uploaded file is another one, though it looks the same.
  std::filesystem::copy_file(path, path + "-copy");
  std::filesystem::last_write_time(path + "-copy", std::filesystem::last_write_time(path));
  std::filesystem::rename(path + "-copy", path);
  EXPECT_EQ(refusal(path), code(EvictionRefusal::ChangedSinceUpload));
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));

  std::filesystem::remove_all(rig.top / "cloud/objects");
  std::filesystem::create_directory(rig.top / "cloud/objects");
  EXPECT_EQ(refusal(path), code(EvictionRefusal::NotUploaded));

  std::filesystem::create_directory(rig.top / "drive/folder");
  std::filesystem::create_symlink(path, rig.top / "drive/link");
  EXPECT_EQ(refusal((rig.top / "drive/folder").string()), code(EvictionRefusal::NotADocument));
  EXPECT_EQ(refusal((rig.top / "drive/link").string()), code(EvictionRefusal::NotADocument));
  EXPECT_EQ(refusal((rig.top / "drive/nothing").string()), "NSCocoaErrorDomain 4");
}

TEST_F(EvictionTest, AFileThatTookTheNameMeanwhileIsNotTouched) {
  const std::string path = uploaded("a", "the document");
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  rig.write("a", "another");
  const NSErrorPtr error = rig.download(kDocument, path);
  EXPECT_EQ(brief(error), "NSCocoaErrorDomain 516");
  EXPECT_EQ(contentsOf(path), "another");
  EXPECT_EQ(rig.names(), (std::vector<std::string>{".a.skein", "a"}));
  std::filesystem::remove(path);
  EXPECT_EQ(brief(rig.download(kDocument, path)), "none");
  EXPECT_EQ(contentsOf(path), "the document");
}

TEST_F(EvictionTest, AWriterThatCameAtTheLastMomentKeepsTheFile) {
  // What is left when the process ends between setting the file aside and removing it, and
  // a program that had it open by then wrote to it.
  const std::string path = uploaded("a", "the document");
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  rig.write(".a.skein-old", "the document, and more");
  ASSERT_TRUE(rig.records->beginWork(path));
  ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
  EXPECT_EQ(rig.names(), std::vector<std::string>{"a"});
  EXPECT_EQ(contentsOf(path), "the document, and more");

  // And when the name is taken, too, both stay.
  rig.write(".a.skein-old", "third");
  ASSERT_TRUE(rig.records->beginWork(path));
  ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
  EXPECT_EQ(rig.names(), (std::vector<std::string>{"a", "a 2"}));
  EXPECT_EQ(rig.records->unfinishedWork()->size(), 0u);
}

TEST(EvictionMarkerTest, WhatIsNoMarkerIsNotTakenForOne) {
  EvictionMarker marker;
  marker.document = documentNumber(7);
  const std::string text = marker.asText();
  ASSERT_TRUE(EvictionMarker::parse(text));
  std::string later = text;
  later.insert(later.find("end\n"), "colour green\n");
  EXPECT_TRUE(EvictionMarker::parse(later));
  EXPECT_FALSE(EvictionMarker::parse(""));
  EXPECT_FALSE(EvictionMarker::parse(text + "more"));
  for (std::size_t cut = 0; cut < text.size(); ++cut) {
    EXPECT_FALSE(EvictionMarker::parse(text.substr(0, cut))) << cut;
  }
  for (const auto& [from, to] : std::map<std::string, std::string>{{"marker 1", "marker 2"},
                                                                   {"document d", "document i"},
                                                                   {"size 0", "size -1"},
                                                                   {"hash 0", "hash g"},
                                                                   {"mode 600", "mode 9"},
                                                                   {"size 0\n", ""}}) {
    std::string wrong = text;
    wrong.replace(wrong.find(from), from.size(), to);
    EXPECT_FALSE(EvictionMarker::parse(wrong)) << to;
  }
}

}  // namespace
}  // namespace skein::vald
