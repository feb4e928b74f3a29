#include "fileindex/util/file_type.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cstdint>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace quarry::fileindex {
namespace {

#include "fileindex/util/file_type_table.inc"

// Tells any change of a text, the order of its parts included.
std::uint64_t Fingerprint(const std::string& text) {
  std::uint64_t hash = 0xcbf29ce484222325;
  for (const char c : text) hash = (hash ^ static_cast<unsigned char>(c)) * 0x100000001b3;
  return hash;
}

std::string Joined(const std::vector<std::string>& words, const std::string& separator) {
  std::string text;
  for (const std::string& word : words) text += (&word == &words.front() ? "" : separator) + word;
  return text;
}

template <size_t size>
std::vector<std::string> List(const char* const (&extensions)[size]) {
  return {extensions, extensions + size};
}

std::vector<std::string> AllExtensions() {
  std::vector<std::string> all;
  for (const auto& list : {List(kDocumentExtensions), List(kAudioExtensions),
                           List(kVideoExtensions), List(kImageExtensions)}) {
    all.insert(all.end(), list.begin(), list.end());
  }
  return all;
}

TEST(FileTypeTest, Values) {
  EXPECT_EQ(static_cast<int>(kDocument), 0);
  EXPECT_EQ(static_cast<int>(kAudio), 1);
  EXPECT_EQ(static_cast<int>(kVideo), 2);
  EXPECT_EQ(static_cast<int>(kImage), 3);
  EXPECT_EQ(static_cast<int>(kOther), 4);
}

TEST(FileTypeTest, TheTableHasItsPairsAndKeys) {
  const std::vector<std::string> all = AllExtensions();
  EXPECT_EQ(all.size(), 736u);
  EXPECT_EQ(std::set<std::string>(all.begin(), all.end()).size(), 735u);
  EXPECT_EQ(std::count(all.begin(), all.end(), "prc"), 2);
}

TEST(FileTypeTest, EachCategoryHasItsKeys) {
  const std::vector<std::string> documents = List(kDocumentExtensions);
  EXPECT_EQ(std::set<std::string>(documents.begin(), documents.end()).size(), 645u + 1);
  EXPECT_EQ(documents.front(), "");
  EXPECT_EQ(std::size(kAudioExtensions), 25u);
  EXPECT_EQ(std::size(kVideoExtensions), 31u);
  EXPECT_EQ(std::size(kImageExtensions), 33u);
}

// The data must not change by accident, as by a slip of an editor.
TEST(FileTypeTest, TheTableIsTheAgreedOne) {
  EXPECT_EQ(Fingerprint(Joined(List(kDocumentExtensions), ",")), 0x16b8548d30c6c7c7u);
  EXPECT_EQ(Fingerprint(Joined(List(kAudioExtensions), ",")), 0x4dcbd19a739b9e0eu);
  EXPECT_EQ(Fingerprint(Joined(List(kVideoExtensions), ",")), 0x3c789791635a1b3bu);
  EXPECT_EQ(Fingerprint(Joined(List(kImageExtensions), ",")), 0x96028cb2be6a6715u);
}

TEST(FileTypeTest, TheHelperOfExtensionsIsOneDefinition) {
  EXPECT_EQ(&fileindex::GetFileExtension, &quarry::GetFileExtension);
}

TEST(FileTypeTest, ExtensionsAreLowerCaseWithoutDot) {
  for (const std::string& extension : AllExtensions()) {
    EXPECT_TRUE(std::none_of(extension.begin(), extension.end(), [](char c) {
      return (c >= 'A' && c <= 'Z') || c == '.' || c == '/' || c == ' ' || c == ',';
    })) << extension;
  }
}

template <size_t size>
void ExpectAll(const char* const (&extensions)[size], FileType type) {
  for (const char* extension : extensions) {
    EXPECT_EQ(GetFileTypeByFullPath(std::string("/v/s/a.") + extension), type) << extension;
  }
}

TEST(FileTypeTest, EveryKeyHasItsCategory) {
  ExpectAll(kDocumentExtensions, kDocument);
  ExpectAll(kAudioExtensions, kAudio);
  ExpectAll(kVideoExtensions, kVideo);
  ExpectAll(kImageExtensions, kImage);
}

struct Sample {
  const char* path;
  FileType type;
};

void PrintTo(const Sample& sample, std::ostream* out) {
  *out << sample.path;
}

class FileTypeSampleTest : public ::testing::TestWithParam<Sample> {};

TEST_P(FileTypeSampleTest, Category) {
  EXPECT_EQ(GetFileTypeByFullPath(GetParam().path), GetParam().type) << GetParam().path;
}

INSTANTIATE_TEST_SUITE_P(
    Edges, FileTypeSampleTest,
    ::testing::Values(
        Sample{"/v/s/a.JPG", kImage}, Sample{"/v/s/README", kDocument},
        Sample{"/v/s/a.", kDocument}, Sample{"/v/s/a.tar.gz", kDocument},
        Sample{"/v/s/a.xyz1", kOther}, Sample{"/v/s.d/file", kDocument},
        Sample{"/v/s.mp3/file", kDocument}, Sample{"/v/s/man.7", kDocument},
        Sample{"/v/s/x.1", kDocument}, Sample{"/v/s/.profile", kOther}, Sample{"/v/s/.mp3", kAudio},
        Sample{"", kDocument}, Sample{"/v/s/dir.mp3/", kDocument}, Sample{"a.FlAc", kAudio},
        Sample{"/v/a.dvr-ms", kVideo}, Sample{"/v/a.ts", kVideo}, Sample{"/v/a.prc", kDocument},
        Sample{"/v/a.q&a", kDocument}, Sample{"/v/a.tx?", kDocument}, Sample{"/v/a.!!!", kDocument},
        Sample{"/v/a.$00", kDocument}, Sample{"/v/a._me", kDocument}, Sample{"/v/a.lit", kDocument},
        Sample{"/v/a.raw", kImage}, Sample{"/v/a.cue", kAudio}, Sample{"/v/a.tp", kVideo},
        Sample{"/v/a.mp3 ", kOther}, Sample{"/v/a.jpgx", kOther}, Sample{"/v/a.jp", kOther}));

// ---- Query texts

std::vector<std::string> Words(const FileTypeQuery& query) {
  std::vector<std::string> words;
  std::istringstream stream(query.query);
  std::string word;
  for (int i = 0; stream >> word; ++i) {
    if (i % 2 == 1) {
      EXPECT_EQ(word, "OR") << query.name;
    } else {
      words.push_back(word);
    }
  }
  return words;
}

std::set<std::string> Set(const std::vector<std::string>& words) {
  return {words.begin(), words.end()};
}

TEST(FileTypeQueryTest, Names) {
  EXPECT_STREQ(kDocumentQuery.name, "document");
  EXPECT_STREQ(kAudioQuery.name, "audio");
  EXPECT_STREQ(kVideoQuery.name, "video");
  EXPECT_STREQ(kImageQuery.name, "image");
}

TEST(FileTypeQueryTest, ThePiecesAreJoinedByOneBlank) {
  for (const FileTypeQuery* query : {&kDocumentQuery, &kAudioQuery, &kVideoQuery, &kImageQuery}) {
    EXPECT_EQ(query->query, Joined(Words(*query), " OR "));
  }
}

TEST(FileTypeQueryTest, TheTextsAreTheAgreedOnes) {
  EXPECT_EQ(Fingerprint(kDocumentQuery.query), 0x00a881d58270bb1cu);
  EXPECT_EQ(Fingerprint(kAudioQuery.query), 0xda39456df10f20d6u);
  EXPECT_EQ(Fingerprint(kVideoQuery.query), 0x42d5637b82e0e7bbu);
  EXPECT_EQ(Fingerprint(kImageQuery.query), 0x6467178ebac267e9u);
}

TEST(FileTypeQueryTest, Documents) {
  const std::string text = kDocumentQuery.query;
  EXPECT_EQ(text.rfind("docx OR wri OR rtf OR xla OR ", 0), 0u);
  EXPECT_EQ(text.substr(text.size() - 32), "zw3 OR pdb OR epub OR chm OR lit");
  const std::vector<std::string> words = Words(kDocumentQuery);
  EXPECT_EQ(words.size(), 89u);
  EXPECT_EQ(std::count(words.begin(), words.end(), "cs"), 2);
  EXPECT_NE(text.find("eml OR msgc OR c OR cc"), std::string::npos);
  EXPECT_EQ(Set(words).count("msg"), 0u);
}

// These three name exactly the table's extensions, in another order.
TEST(FileTypeQueryTest, AudioVideoImage) {
  EXPECT_EQ(Words(kAudioQuery).size(), 25u);
  EXPECT_EQ(Set(Words(kAudioQuery)), Set(List(kAudioExtensions)));
  EXPECT_EQ(Words(kVideoQuery).size(), 31u);
  EXPECT_EQ(Set(Words(kVideoQuery)), Set(List(kVideoExtensions)));
  EXPECT_EQ(Words(kImageQuery).size(), 33u);
  EXPECT_EQ(Set(Words(kImageQuery)), Set(List(kImageExtensions)));
}

}  // namespace
}  // namespace quarry::fileindex
