#include "daemons/tarncontentextractd/attributes.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>

#include "common/json.h"
#include "daemons/tarncontentextractd/path_open.h"
#include "daemons/tarncontentextractd/stamp.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

// A file that differs from every other in every attribute.
Attributes Sample() {
  Attributes attributes;
  struct stat& status = attributes.status;
  status.st_mode = S_IFREG | 04751;
  status.st_uid = 1001;
  status.st_gid = 4294967294;
  status.st_dev = 64;
  status.st_ino = 12345678901234567890u;
  status.st_size = 5000000000;
  status.st_blocks = 16;
  status.st_mtim = {1600000001, 999999999};
  status.st_ctim = {1600000002, 5};
  status.st_atim = {1600000003, 0};
  attributes.birth_time = 1500000000;
  return attributes;
}

Json::Value Parsed(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text));
  return value;
}

Json::Value AttributeDocument(const std::string& path, const Attributes& attributes) {
  return Parsed(AttributeText(path, attributes));
}

TEST(AttributeDocument, HoldsEveryFieldOfAFile) {
  const Json::Value expected = Parsed(R"({
    "TARNMDPath": "/volume1/photo/a.tar.JPG",
    "TARNMDParent": "/volume1/photo",
    "TARNMDFSName": "a.tar.JPG",
    "TARNMDDisplayName": "a.tar.JPG",
    "TARNMDExtension": "jpg",
    "TARNMDKind": "jpg",
    "TARNMDIsDir": false,
    "TARNMDOwnerUserID": "1001",
    "TARNMDOwnerGroupID": "4294967294",
    "TARNMDPrivilege": "4751",
    "TARNMDFSSize": 5000000000,
    "TARNMDLogicalSize": 5000000000,
    "TARNMDPhysicalSize": 8192,
    "TARNMDFSContentChangeDate": 1600000001,
    "TARNMDContentModificationDate": 1600000001,
    "TARNMDAttributeChangeDate": 1600000002,
    "TARNMDLastUsedDate": 1600000003,
    "TARNMDFSCreationDate": 1500000000,
    "TARNMDContentCreationDate": 1500000000,
    "TARNMDDateAdded": 1500000000,
    "QuarryAttributeStamp":
      "64:12345678901234567890:5000000000:1600000001999999999:1600000002000000005"
  })");
  EXPECT_EQ(toString(AttributeDocument("/volume1/photo/a.tar.JPG", Sample())), toString(expected));
}

TEST(AttributeDocument, TimesOfBirthThatAreNotKeptAreLeftOut) {
  Attributes attributes = Sample();
  attributes.birth_time = 0;
  const Json::Value document = AttributeDocument("/a", attributes);
  for (const char* name :
       {"TARNMDFSCreationDate", "TARNMDContentCreationDate", "TARNMDDateAdded"}) {
    EXPECT_FALSE(document.isMember(name)) << name;
  }
}

TEST(AttributeDocument, NamesAreTakenFromThePath) {
  const struct {
    const char* path;
    const char* parent;
    const char* name;
    const char* extension;
  } kCases[] = {{"/a", "/", "a", ""},
                {"/v/a.", "/v", "a.", ""},
                {"/v/.profile", "/v", ".profile", "profile"},
                {"/v.d/a", "/v.d", "a", ""},
                {"/v/\xFF\xC3.\xC9X", "/v", "\xFF\xC3.\xC9X", "\xC9x"}};
  for (const auto& each : kCases) {
    const Json::Value document = AttributeDocument(each.path, Sample());
    EXPECT_EQ(document["TARNMDPath"].asString(), each.path);
    EXPECT_EQ(document["TARNMDParent"].asString(), each.parent) << each.path;
    EXPECT_EQ(document["TARNMDFSName"].asString(), each.name) << each.path;
    EXPECT_EQ(document["TARNMDDisplayName"].asString(), each.name) << each.path;
    EXPECT_EQ(document["TARNMDExtension"].asString(), each.extension) << each.path;
    EXPECT_EQ(document["TARNMDKind"].asString(), each.extension) << each.path;
  }
}

TEST(AttributeDocument, ModesAreFourOctalDigits) {
  Attributes attributes = Sample();
  for (const auto& [mode, text] : {std::pair<mode_t, const char*>{S_IFREG | 0644, "0644"},
                                   {S_IFDIR | 01777, "1777"},
                                   {S_IFIFO | 0, "0000"},
                                   {S_IFREG | 07777, "7777"}}) {
    attributes.status.st_mode = mode;
    const Json::Value document = AttributeDocument("/a", attributes);
    EXPECT_EQ(document["TARNMDPrivilege"].asString(), text);
    EXPECT_EQ(document["TARNMDIsDir"].asBool(), S_ISDIR(mode));
  }
}

TEST(ReadAttributes, SaysWhatTheSystemSays) {
  const test::TempDir dir;
  test::WriteFile(dir / "file", "12345");
  const timespec times[2] = {{-5, 1}, {-86400, 500000000}};
  ASSERT_EQ(utimensat(AT_FDCWD, (dir / "file").c_str(), times, 0), 0);
  struct stat status {};
  ASSERT_EQ(lstat((dir / "file").c_str(), &status), 0);
  Attributes attributes;
  ASSERT_TRUE(ReadAttributes(OpenPlace(dir / "file").get(), &attributes));
  const Json::Value document = AttributeDocument(dir / "file", attributes);
  EXPECT_EQ(document["TARNMDFSSize"].asInt64(), 5);
  EXPECT_EQ(document["TARNMDPhysicalSize"].asInt64(), status.st_blocks * 512);
  EXPECT_EQ(document["TARNMDFSContentChangeDate"].asInt64(), status.st_mtim.tv_sec);
  EXPECT_EQ(document["TARNMDAttributeChangeDate"].asInt64(), status.st_ctim.tv_sec);
  EXPECT_EQ(document["TARNMDOwnerUserID"].asString(), std::to_string(geteuid()));
  EXPECT_EQ(document["QuarryAttributeStamp"].asString(), AttributeStamp(status));
}

TEST(ReadAttributes, FailsWithoutADescriptor) {
  Attributes attributes;
  errno = 0;
  EXPECT_FALSE(ReadAttributes(-1, &attributes));
  EXPECT_EQ(errno, EBADF);
}

TEST(Stamps, HoldWhatTellsOneStateOfAFileFromAnother) {
  const struct stat status = Sample().status;
  EXPECT_EQ(AttributeStamp(status),
            "64:12345678901234567890:5000000000:1600000001999999999:1600000002000000005");
  EXPECT_EQ(ContentStamp(status), "1:5000000000:1600000001999999999");
}

TEST(Stamps, TimesOfAnyYearHaveATextOfTheirOwn) {
  EXPECT_EQ(NanosecondText(0, 0), "0");
  EXPECT_EQ(NanosecondText(0, 7), "7");
  EXPECT_EQ(NanosecondText(-1, 500000000), "-500000000");
  EXPECT_EQ(NanosecondText(9223372036, 854775807), "9223372036854775807");
  // The years 2446 and 2514, and the ends of time.
  EXPECT_NE(NanosecondText(15032385535, 0), NanosecondText(15032385535, 1));
  EXPECT_NE(NanosecondText(17179869183, 0), NanosecondText(15032385535, 0));
  EXPECT_NE(NanosecondText(INT64_MAX, 0), NanosecondText(INT64_MIN, 0));
}

}  // namespace
}  // namespace quarry::extract
