// Out to the cloud and back: what may go, why something may not, what comes back.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

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
  std::string longest(253, 'z');
  longest.insert(0, "\xc3\xa9");
  // Cut within a character, were it cut at 200 bytes.
  std::string accented(249, 'w');
  accented.insert(199, "\xc3\xa9");
  for (const std::string& name :
       {odd, std::string(240, 'x'), std::string(241, 'y'), longest, accented}) {
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

  for (const char* name : {".a.skein", ".a.skein-new", ".a.skein-part"}) {
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

  // A program that runs with its owner's or its group's rights: no marker gives them back.
  for (const mode_t mode : {04755, 02755}) {
    ASSERT_EQ(chmod(path.c_str(), mode), 0);
    ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
    EXPECT_EQ(refusal(path), code(EvictionRefusal::NotADocument));
  }
  ASSERT_EQ(chmod(path.c_str(), 0644), 0);

  // Too large to be compared while somebody waits.
  const std::string large = rig.write("large", "");
  std::filesystem::resize_file(large, 129 << 20);
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(documentNumber(8), large)));
  setTags(large, "red");
  EXPECT_TRUE(rig.evict(documentNumber(8), large));
  std::filesystem::remove(large);

  std::filesystem::create_directory(rig.top / "drive/folder");
  std::filesystem::create_symlink(path, rig.top / "drive/link");
  EXPECT_EQ(refusal((rig.top / "drive/folder").string()), code(EvictionRefusal::NotADocument));
  EXPECT_EQ(refusal((rig.top / "drive/link").string()), code(EvictionRefusal::NotADocument));
  EXPECT_EQ(refusal((rig.top / "drive/nothing").string()), "NSCocoaErrorDomain 4");
}

TEST_F(EvictionTest, TheCloudsCopyIsVerifiedAndMendedBeforeTheFileGoes) {
  const std::string path = uploaded("a", "the document");
  const std::string hash = (*rig.records->record(kDocument))->contents.hash.asString();
  const auto object = rig.top / "cloud/objects" / hash.substr(0, 2) / hash;
  const auto spoil = [&] {
    std::filesystem::permissions(object, std::filesystem::perms::owner_all);
    std::ofstream(object) << "the docum3nt";  // as long as it was
  };
  for (const bool lost : {false, true}) {
    spoil();
    if (lost) std::filesystem::remove(object);
    ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
    EXPECT_EQ(contentsOf(object), "the document");
    ASSERT_EQ(brief(rig.download(kDocument, path)), "none");
    EXPECT_EQ(contentsOf(path), "the document");
  }
  // Nor does an upload believe a copy for its length: not another document's either.
  spoil();
  const std::string twin = rig.write("twin", "the document");
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(documentNumber(9), twin)));
  EXPECT_EQ(contentsOf(object), "the document");
  spoil();
  setTags(path, "red");
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  EXPECT_EQ(contentsOf(object), "the document");

  // The file is no longer what was uploaded, and what was uploaded is lost: it stays.
  spoil();
  std::ofstream(path) << "other words!";
  EXPECT_EQ(refusal(path), code(EvictionRefusal::NotUploaded));
}

TEST_F(EvictionTest, OnlyAMarkerThatWasMadeHereIsServed) {
  const std::string path = uploaded("a", "a secret");
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  const std::string marker = (rig.top / "drive/.a.skein").string();
  const std::string text = contentsOf(marker);
  const auto served = [&](const std::string& changed) {
    std::ofstream(marker) << changed;
    const std::string answer = brief(rig.download(kDocument, path));
    if (answer == "none") {
      EXPECT_EQ(contentsOf(path), "a secret");
      EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
      EXPECT_EQ(brief(rig.evict(kDocument, path)), "none");
    } else {
      EXPECT_EQ(rig.names(), std::vector<std::string>{".a.skein"});
    }
    return answer;
  };
  const auto with = [&](const std::string& from, const std::string& to) {
    std::string changed = text;
    changed.replace(changed.find(from), from.size(), to);
    return changed;
  };
  EXPECT_EQ(served(text), "none");
  // The key that it was sealed with is lost: its document's record vouches for it.
  const std::string seal = "seal " + EvictionMarker::parse(text)->seal->asString();
  const std::string otherSeal = "seal " + std::string(seal.size() - 5, '0');
  EXPECT_EQ(served(with(seal, otherSeal)), "none");
  EXPECT_EQ(served(with("size 8", "size 9")), "NSCocoaErrorDomain 259");
  EXPECT_EQ(served(with("end\n", "mode 777\nend\n")), "NSCocoaErrorDomain 259");
  // One without a seal needs the record that it speaks of.
  const std::string bare = EvictionMarker::parse(text)->asText();
  EXPECT_EQ(served(bare), "none");
  std::string endless = bare;
  endless.replace(endless.find("size 8"), 6, "size 9000000000000000000");
  EXPECT_EQ(served(endless), "NSCocoaErrorDomain 259");
  ASSERT_EQ(brief(rig.records->remove(kDocument)), "none");
  EXPECT_EQ(served(bare), "NSCocoaErrorDomain 259");
  EXPECT_EQ(served(with(seal, otherSeal)), "NSCocoaErrorDomain 259");
  EXPECT_EQ(served(with("mode 6", "mode 7")), "NSCocoaErrorDomain 259");
  EXPECT_EQ(served(text), "none");
  if (geteuid() != 0) return;
  std::ofstream(marker) << text;
  ASSERT_EQ(chown(marker.c_str(), 12345, 12345), 0);
  EXPECT_EQ(brief(rig.download(kDocument, path)), "NSCocoaErrorDomain 259");
}

TEST_F(EvictionTest, GroupListsHolesAndFarDatesComeBack) {
  const std::string path = rig.write("a", "words");
  std::filesystem::resize_file(path, 40 << 20);
  const timespec times[2] = {{1700000001, 5}, {20'000'000'000, 7}};  // after 2262
  ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  if (geteuid() == 0) {
    ASSERT_EQ(chown(path.c_str(), -1, 12345), 0);
  }
  // user::rw-, user:12345:r--, group::---, mask::r--, other::---
  const unsigned char list[] = {2, 0,  0,   0,   1,   0,   6,  0, 255, 255, 255, 255, 2,   0,  4,
                                0, 57, 48,  0,   0,   4,   0,  0, 0,   255, 255, 255, 255, 16, 0,
                                4, 0,  255, 255, 255, 255, 32, 0, 0,   0,   255, 255, 255, 255};
  const bool hasLists =
      setxattr(path.c_str(), "system.posix_acl_access", list, sizeof list, 0) == 0;
  struct stat before {};
  struct stat after {};
  ASSERT_EQ(stat(path.c_str(), &before), 0);
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  if (hasLists) {
    // What the folder gives to new files by default is not the file's.
    ASSERT_EQ(
        setxattr((rig.top / "drive").c_str(), "system.posix_acl_default", list, sizeof list, 0), 0);
  }
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  ASSERT_EQ(brief(rig.download(kDocument, path)), "none");
  ASSERT_EQ(stat(path.c_str(), &after), 0);
  EXPECT_EQ(after.st_size, before.st_size);
  EXPECT_LE(after.st_blocks, before.st_blocks + 1024);
  EXPECT_EQ(after.st_gid, before.st_gid);
  EXPECT_EQ(after.st_mode, before.st_mode);
  EXPECT_EQ(after.st_mtim.tv_sec, before.st_mtim.tv_sec);
  EXPECT_EQ(after.st_mtim.tv_nsec, before.st_mtim.tv_nsec);
  if (!hasLists) return;
  std::string got(200, '\0');
  got.resize(std::max<ssize_t>(
      0, getxattr(path.c_str(), "system.posix_acl_access", got.data(), got.size())));
  EXPECT_EQ(got, std::string(reinterpret_cast<const char*>(list), sizeof list));
  // And a file that had none gets none.
  const std::string plain = rig.write("plain", "words");
  removexattr(plain.c_str(), "system.posix_acl_access");
  ASSERT_EQ(chmod(plain.c_str(), 0640), 0);
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(documentNumber(5), plain)));
  ASSERT_EQ(brief(rig.evict(documentNumber(5), plain)), "none");
  ASSERT_EQ(brief(rig.download(documentNumber(5), plain)), "none");
  EXPECT_LT(getxattr(plain.c_str(), "system.posix_acl_access", got.data(), got.size()), 0);
}

TEST_F(EvictionTest, AStaleMarkerGoesAndAnothersStays) {
  const std::string path = uploaded("a", "one");
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  rig.write("a", "two, by another program");
  EXPECT_EQ(refusal(path), code(EvictionRefusal::MarkerNameTaken));  // not uploaded yet
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(documentNumber(4), path)));
  EXPECT_EQ(brief(rig.evict(documentNumber(4), path)),
            "SkeinEvictionErrorDomain 8");  // it may be the other document's only trace
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  ASSERT_EQ(brief(rig.download(kDocument, path)), "none");
  EXPECT_EQ(contentsOf(path), "two, by another program");
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

TEST_F(EvictionTest, AWriterThatOpensJustBeforeTheFileGoesKeepsIt) {
  const std::string path = uploaded("a", "the document");
  FileDescriptor held(open(path.c_str(), O_RDONLY | O_CLOEXEC));  // who found it by name
  std::atomic<int> writer{-1};
  // Once the file is set aside, in the last sync before it would be removed.
  rig.files.before = [&](FileStep step, std::string_view) {
    if (step != FileStep::Sync || !std::filesystem::exists(rig.top / "drive/.a.skein-old")) return;
    const std::string name = descriptorPath(held.get());
    // It waits while the lease stands; without waiting it is told so, and the lease breaks.
    EXPECT_EQ(open(name.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC), -1);
    EXPECT_EQ(errno, EWOULDBLOCK);
    ++writer;
  };
  EXPECT_EQ(refusal(path), code(EvictionRefusal::OpenForWriting));
  EXPECT_GE(writer, 0);
  EXPECT_EQ(rig.names(), std::vector<std::string>{"a"});
}

TEST_F(EvictionTest, WhatHappensToTheFileWhileItGoesKeepsIt) {
  const std::string path = uploaded("a", "the document");
  const auto changed = [&] {
    const NSErrorPtr error = rig.evict(kDocument, path);
    rig.files.before = nullptr;
    EXPECT_FALSE(std::filesystem::exists(rig.top / "drive/.a.skein"));
    EXPECT_EQ(contentsOf(path).size(), 12u);
    return error != nullptr &&
           error->code() == static_cast<std::int64_t>(EvictionRefusal::ChangedSinceUpload);
  };
  const auto isThere = [&](const char* name) {
    return std::filesystem::exists(rig.top / "drive" / name);
  };
  // Tags, which the marker would not have.
  rig.files.before = [&](FileStep step, std::string_view) {
    if (step == FileStep::Sync && isThere(".a.skein-new")) setTags(path, "late");
  };
  EXPECT_TRUE(changed());
  // A date, once it is set aside.
  rig.files.before = [&](FileStep step, std::string_view) {
    const timespec times[2] = {{1, 0}, {1, 0}};
    if (step != FileStep::Sync || !isThere(".a.skein-old")) return;
    EXPECT_EQ(utimensat(AT_FDCWD, (rig.top / "drive/.a.skein-old").c_str(), times, 0), 0);
  };
  EXPECT_TRUE(changed());
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  // Another file takes its name.
  rig.files.before = [&](FileStep step, std::string_view name) {
    if (step != FileStep::Rename || name != "a" || isThere("b")) return;
    std::filesystem::rename(path, rig.top / "drive/b");
    rig.write("a", "the d0cument");
  };
  EXPECT_TRUE(changed());
  EXPECT_EQ(contentsOf(path), "the d0cument");
  EXPECT_EQ(contentsOf((rig.top / "drive/b").string()), "the document");
  std::filesystem::remove(rig.top / "drive/b");
  // It gets another name.
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  rig.files.before = [&](FileStep step, std::string_view name) {
    if (step == FileStep::Rename && name == "a") std::filesystem::rename(path, path + "2");
  };
  EXPECT_NE(rig.evict(kDocument, path), nullptr);
  rig.files.before = nullptr;
  EXPECT_EQ(rig.names(), std::vector<std::string>{"a2"});
  std::filesystem::rename(path + "2", path);

  // It is uploaded again before it is looked at: those contents were not verified.
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  CloudPlaces places = rig.places();
  places.coordinate = [&](const std::string&) {
    rig.write("a", "third words!");
    EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
    return Outcome<std::shared_ptr<void>>(std::shared_ptr<void>());
  };
  const NSErrorPtr error = Eviction(places).evict({kDocument, path, "text/plain"});
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(EvictionRefusal::ChangedSinceUpload));
}

TEST_F(EvictionTest, RecoveryComparesContentsAndFindsTheMovedFolder) {
  const std::string path = uploaded("a", "the document");
  const auto date = std::filesystem::last_write_time(path);
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  const auto hash = (*rig.records->record(kDocument))->contents.hash;
  const auto note = [&](const std::string& folder) {
    StorePlace place;
    ASSERT_EQ(brief(rig.roots.locate(folder, "a", place)), "none");
    ASSERT_TRUE(rig.places().beginWork(place, hash));
  };
  // A writer of as many bytes, who put the date back.
  std::filesystem::last_write_time(rig.write(".a.skein-old", "the d0cument"), date);
  note((rig.top / "drive").string());
  ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
  EXPECT_EQ(rig.names(), std::vector<std::string>{"a"});
  EXPECT_EQ(contentsOf(path), "the d0cument");
  std::filesystem::remove(path);

  // The marker was moved away: the file was about to go, and no second one comes back.
  rig.write(".a.skein-old", "the document");
  note((rig.top / "drive").string());
  ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
  EXPECT_EQ(rig.names(), std::vector<std::string>{});

  // There is a marker that is not believed: the file comes back, and both stay.
  EvictionMarker forged;
  forged.document = documentNumber(77);
  forged.contents = {hash, 12};
  for (const std::string& text : {std::string("no marker"), forged.asText()}) {
    rig.write(".a.skein-old", "the document");
    rig.write(".a.skein", text);
    note((rig.top / "drive").string());
    ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
    EXPECT_EQ(contentsOf(path), "the document");
    EXPECT_TRUE(std::filesystem::remove(rig.top / "drive/.a.skein"));
    std::filesystem::remove(path);
  }

  // The marker was moved away, and the cloud's contents are spoiled: the file is the only copy.
  const auto object = rig.top / "cloud/objects" / hash.asString().substr(0, 2) / hash.asString();
  std::filesystem::permissions(object, std::filesystem::perms::owner_all);
  std::ofstream(object) << "the docum3nt";
  rig.write(".a.skein-old", "the document");
  note((rig.top / "drive").string());
  ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
  EXPECT_EQ(contentsOf(path), "the document");
  std::filesystem::remove(path);

  // The folder was renamed since, and another has its name.
  std::filesystem::create_directory(rig.top / "drive/f");
  std::ofstream(rig.top / "drive/f/.a.skein-old") << "late words";
  note((rig.top / "drive/f").string());
  std::filesystem::rename(rig.top / "drive/f", rig.top / "drive/g");
  std::filesystem::create_directory(rig.top / "drive/f");
  ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
  EXPECT_EQ(contentsOf((rig.top / "drive/g/a").string()), "late words");
  EXPECT_TRUE(rig.records->unfinishedWork()->empty());

  // And while the process goes on, what is noted is mended by who comes next.
  const std::string other = uploaded("a", "words");
  ASSERT_EQ(brief(rig.evict(kDocument, other)), "none");
  rig.write(".a.skein-old", "words, more");
  note((rig.top / "drive").string());
  EXPECT_EQ(brief(rig.download(kDocument, other)), "none");
  EXPECT_EQ(contentsOf(other), "words, more");
}

TEST_F(EvictionTest, WhatAnotherDriveOfTheUserEvictedCanBeFetchedAndStays) {
  const std::filesystem::path drives = folder.path() / "drives";
  auto original = std::make_unique<CloudRig>(drives / "A");
  CloudRig copy(drives / "B", drives);
  const std::string path = original->write("a", "the document");
  ASSERT_TRUE(std::holds_alternative<UploadDone>(original->upload(kDocument, path)));
  ASSERT_EQ(brief(original->evict(kDocument, path)), "none");
  const auto hash = (*original->records->record(kDocument))->contents.hash;
  for (const char* name : {".a.skein", ".b.skein"}) {
    std::filesystem::copy_file(drives / "A/drive/.a.skein", drives / "B/drive" / name);
  }
  EXPECT_EQ(brief(copy.download(kDocument, (drives / "B/drive/a").string())), "none");
  EXPECT_EQ(contentsOf((drives / "B/drive/a").string()), "the document");
  EXPECT_FALSE(*copy.records->stamp(kDocument));

  // A look at the drive takes over what its markers name, and the other drive may go.
  std::filesystem::remove(copy.top / "cloud/objects" / hash.asString().substr(0, 2) /
                          hash.asString());
  ASSERT_TRUE(copy.collect(std::chrono::hours(1), 1000));
  original.reset();
  std::filesystem::remove_all(drives / "A");
  EXPECT_TRUE(copy.hasObject(hash));
  copy.contents.reset();
  auto again = CloudContents::open((copy.top / "cloud").string(), copy.files, drives.string());
  ASSERT_TRUE(again);
  copy.contents = std::move(*again);
  EXPECT_EQ(brief(copy.download(kDocument, (drives / "B/drive/b").string())), "none");
  EXPECT_EQ(contentsOf((drives / "B/drive/b").string()), "the document");

  // Only what its cloud stands beside this one.
  ASSERT_EQ(brief(rig.evict(kDocument, uploaded("a", "others"))), "none");
  std::filesystem::copy_file(rig.top / "drive/.a.skein", drives / "B/drive/.c.skein");
  EXPECT_EQ(brief(copy.download(kDocument, (drives / "B/drive/c").string())),
            "NSCocoaErrorDomain 259");
}

TEST_F(EvictionTest, AFileSetAsideThatNoNoteTellsOfComesOut) {
  // Somebody's own, or one whose note is lost: it is in the way of neither.
  const std::string path = uploaded("a", "the document");
  rig.write(".a.skein-old", "others");
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  EXPECT_EQ(rig.names(), (std::vector<std::string>{".a.skein", "a 2"}));
  EXPECT_EQ(contentsOf(path + " 2"), "others");
  rig.write(".a.skein-old", "more");
  EXPECT_EQ(brief(rig.download(kDocument, path)), "none");
  EXPECT_EQ(rig.names(), (std::vector<std::string>{"a", "a 2", "a 3"}));
  EXPECT_EQ(contentsOf(path), "the document");
  EXPECT_EQ(contentsOf(path + " 3"), "more");

  // What the marker stands for is the document.
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  rig.write(".a.skein-old", "the document");
  EXPECT_EQ(brief(rig.download(kDocument, path)), "none");
  EXPECT_EQ(rig.names(), (std::vector<std::string>{"a", "a 2", "a 3"}));
  EXPECT_EQ(contentsOf(path), "the document");
}

TEST_F(EvictionTest, AMarkerThatWasCopiedLeavesTheDocumentsStampAlone) {
  const std::string path = uploaded("a");
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  std::filesystem::copy_file(rig.top / "drive/.a.skein", rig.top / "drive/.b.skein");
  const std::string copy = (rig.top / "drive/b").string();
  ASSERT_EQ(brief(DownloadTransfer(rig.places(), rig.conditions, rig.clock, kDocument, copy, true,
                                   nullptr)
                      .run()),
            "none");
  EXPECT_EQ(contentsOf(copy), "words");
  EXPECT_FALSE(*rig.records->stamp(kDocument));
}

TEST_F(EvictionTest, AWriterThatCameAtTheLastMomentKeepsTheFile) {
  // What is left when the process ends between setting the file aside and removing it, and
  // a program that had it open by then wrote to it.
  const std::string path = uploaded("a", "the document");
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  rig.write(".a.skein-old", "the document, and more");
  ASSERT_TRUE(rig.records->beginWork({0, path, 0, {}}));
  ASSERT_EQ(brief(recoverUnfinishedWork(rig.places())), "none");
  EXPECT_EQ(rig.names(), std::vector<std::string>{"a"});
  EXPECT_EQ(contentsOf(path), "the document, and more");

  // And when the name is taken, too, both stay.
  // One place that cannot be recovered keeps none of the others from it.
  rig.write(".a.skein-old", "third");
  ASSERT_TRUE(rig.records->beginWork({0, "/elsewhere/a", 0, {}}));
  ASSERT_TRUE(rig.records->beginWork({0, path, 0, {}}));
  EXPECT_NE(recoverUnfinishedWork(rig.places()), nullptr);
  EXPECT_EQ(rig.names(), (std::vector<std::string>{"a", "a 2"}));
  EXPECT_EQ(rig.records->unfinishedWork()->size(), 1u);
}

TEST(EvictionMarkerTest, WhatIsNoMarkerIsNotTakenForOne) {
  EvictionMarker marker;
  marker.document = documentNumber(7);
  const std::string text = marker.asText();
  ASSERT_TRUE(EvictionMarker::parse(text));
  std::string later = text;
  later.insert(later.find("end\n"), "colour green\n");
  EXPECT_TRUE(EvictionMarker::parse(later));
  std::string special = text;
  special.replace(special.find("mode 600"), 8, "mode 4755");
  EXPECT_EQ(EvictionMarker::parse(special)->mode, 0755u);
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
                                                                   {"end", "name a%2fb\nend"},
                                                                   {"end", "name ..\nend"},
                                                                   {"size 0\n", ""}}) {
    std::string wrong = text;
    wrong.replace(wrong.find(from), from.size(), to);
    EXPECT_FALSE(EvictionMarker::parse(wrong)) << to;
  }
}

}  // namespace
}  // namespace skein::vald
