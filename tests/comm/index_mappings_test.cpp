// The fields of an index, one by one.

#include <gmock/gmock.h>

#include <string>

#include "comm/elastic_control.h"
#include "common/json.h"

namespace quarry::fileindex::elastic {
namespace {

using ::testing::ElementsAre;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

TEST(IndexMappingsTest, TopLevel) {
  const Json::Value mappings = GetFileIndexMappings();
  EXPECT_THAT(mappings.getMemberNames(), ElementsAre("default", "properties", "property_id"));
  EXPECT_EQ(mappings["property_id"], Json::Value("TARNMDPath"));
  EXPECT_EQ(mappings["default"],
            Parse(R"({"type":"string","analyzer":"tarnstandard","required":false,)"
                  R"("stored":true,"_all":true})"));
}

TEST(IndexMappingsTest, FieldsNameOnlyWhatDiffersFromTheDefault) {
  const Json::Value mappings = GetFileIndexMappings();
  const Json::Value& defaults = mappings["default"];
  const Json::Value& properties = mappings["properties"];
  for (const std::string& field : properties.getMemberNames()) {
    ASSERT_TRUE(properties[field].isObject()) << field;
    for (const std::string& setting : properties[field].getMemberNames()) {
      EXPECT_NE(properties[field][setting], defaults[setting]) << field << " " << setting;
    }
  }
}

struct FieldMapping {
  const char* field;
  const char* settings;
};

class FieldMappingTest : public ::testing::TestWithParam<FieldMapping> {};

TEST_P(FieldMappingTest, Settings) {
  EXPECT_EQ(GetFileIndexMappings()["properties"][GetParam().field], Parse(GetParam().settings));
}

constexpr char kKeyword[] = R"({"analyzer":"keyword"})";
constexpr char kHiddenKeyword[] = R"({"analyzer":"keyword","_all":false})";
constexpr char kInt[] = R"({"type":"int"})";
constexpr char kText[] = R"({"type":"text"})";
constexpr char kNames[] = R"({"type":"text","analyzer":"white space"})";

const FieldMapping kFields[] = {
    {"TARNMDPath", R"({"analyzer":"keyword","_all":false,"required":true})"},
    {"TARNMDFSName", kHiddenKeyword},
    {"TARNMDPrivilege", kHiddenKeyword},
    {"TARNMDIsDir", R"({"type":"bool","_all":false})"},
    {"TARNMDOwnerUserID", kHiddenKeyword},
    {"TARNMDOwnerGroupID", kHiddenKeyword},
    {"TARNMDFSSize", kInt},
    {"TARNMDFSContentChangeDate", kInt},
    {"TARNMDAttributeChangeDate", kInt},
    {"TARNMDFSCreationDate", kInt},
    {"TARNMDContentModificationDate", kInt},
    {"TARNMDLastUsedDate", kInt},
    {"TARNMDContentCreationDate", kInt},
    {"TARNMDAuthors", kNames},
    {"TARNMDTitle", kText},
    {"TARNMDAlbum", kText},
    {"TARNMDIdentifier", R"({"type":"text","analyzer":"keyword","_all":false})"},
    {"TARNMDAudioTrackNumber", kInt},
    {"TARNMDRecordingYear", kInt},
    {"TARNMDCreator", kNames},
    {"TARNMDMusicalGenre", kText},
    {"TARNMDComposer", kNames},
    {"TARNMDComment", kText},
    {"TARNMDDurationSecond", R"({"type":"double"})"},
    {"TARNMDAudioBitRate", kInt},
    {"TARNMDTotalBitRate", kInt},
    {"TARNMDVideoBitRate", kInt},
    {"TARNMDAudioSampleRate", kInt},
    {"TARNMDAudioChannelCount", kInt},
    {"TARNMDISOSpeed", kInt},
    {"TARNMDCodecs", kNames},
    {"TARNMDDescription", kText},
    {"TARNMDAcquisitionMake", kNames},
    {"TARNMDAcquisitionModel", kNames},
    {"TARNMDExposureTimeString", kKeyword},
    {"TARNMDAperture", kKeyword},
    {"TARNMDResolutionWidthDPI", kInt},
    {"TARNMDResolutionHeightDPI", kInt},
    {"TARNMDMediaTypes", kKeyword},
    {"TARNMDParent", kHiddenKeyword},
    {"TARNMDExtension", kHiddenKeyword},
    {"TARNMDTextContent", kText},
    {"TARNMDKeywords", "{}"},
    {"TARNMDFinderLabel", kInt},
    {"TARNMDGroupId", kKeyword},
    {"TARNMDFinderOpenDate", kInt},
    {"TARNMDLogicalSize", kInt},
    {"TARNMDPhysicalSize", kInt},
    {"TARNMDDateAdded", kInt},
    {"TARNMDSearchFileName",
     R"({"type":"text","analyzer":"white space","preprocess":"tolower+ngram"})"},
    {"TARNMDStarRating", kKeyword},
    {"_TARNMDUserTags", kText},
    {"TARNMDSpotlightBoost", kNames},
};

INSTANTIATE_TEST_SUITE_P(Table, FieldMappingTest, ::testing::ValuesIn(kFields),
                         [](const auto& mapping) { return std::string(mapping.param.field); });

TEST(IndexMappingsTest, ThereIsNoOtherField) {
  EXPECT_EQ(GetFileIndexMappings()["properties"].size(), std::size(kFields));
  EXPECT_EQ(std::size(kFields), 53u);
}

constexpr char kMappingText[] =
#include "comm/index_mappings.inc"
    ;

TEST(IndexMappingsTest, TheTextKeepsTheOrderOfItsFields) {
  const std::string text = kMappingText;
  size_t last = text.find("\"properties\"");
  for (const FieldMapping& field : kFields) {
    const size_t place = text.find("\"" + std::string(field.field) + "\":");
    ASSERT_NE(place, std::string::npos) << field.field;
    EXPECT_GT(place, last) << field.field;
    last = place;
  }
}

}  // namespace
}  // namespace quarry::fileindex::elastic
