#include <gtest/gtest.h>

#include "daemons/tarncontentextractd/extractor.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

const std::string kHead = "<?xml version=\"1.0\"?>\n";

TEST(Xml, TextOfAllElements) {
  EXPECT_EQ(
      TextOf(kHead + "<a>one<b x='no'>two</b><![CDATA[ <three> ]]><!-- no --><?no no?></a>", "xml"),
      "one\ntwo\n<three>");
}

TEST(Xml, TitleAndDublinCoreBecomeFields) {
  const Fields fields = ExtractBytes(
      kHead +
          "<doc xmlns:dc='http://purl.org/dc/elements/1.1/'><info><title>The <i>first</i> "
          "title</title></info><title>Another</title><dc:creator>One</dc:creator>"
          "<dc:creator>Two</dc:creator><creator>no</creator>"
          "<dc:description>About</dc:description><dc:subject>key</dc:subject></doc>",
      "xml");
  EXPECT_EQ(fields.at("TARNMDTitle"), "The first title");
  EXPECT_EQ(fields.at("TARNMDAuthors"), "One, Two");
  EXPECT_EQ(fields.at("TARNMDDescription"), "About");
  EXPECT_EQ(fields.at("TARNMDKeywords"), "key");
}

TEST(Xml, AttributesAreReadWhereElementsHoldNoText) {
  EXPECT_EQ(TextOf(kHead + "<list>\n<entry code='de' name='German &amp; more'/><entry code='fr'/>"
                           "</list>",
                   "xml"),
            "de German & more\nfr");
  EXPECT_EQ(TextOf("<svg xmlns='http://www.w3.org/2000/svg'><path d='M0 0'/></svg>", "svg"), "");
  EXPECT_EQ(TextOf("<svg xmlns='http://www.w3.org/2000/svg'><text>Label</text></svg>", "svg"),
            "Label");
}

TEST(Xml, EncodingsAreDecoded) {
  const std::string russian = "\xD0\x94\xD0\xB0";
  for (const char* charset : {"windows-1251", "KOI8-R", "UTF-8"}) {
    const std::string text =
        "<?xml version='1.0' encoding='" + std::string(charset) + "'?><a>" + russian + "</a>";
    EXPECT_EQ(TextOf(Encode(text, charset), "xml"), russian) << charset;
  }
  for (const char* charset : {"UTF-16LE", "UTF-16BE", "UTF-32LE", "UTF-32BE"}) {
    const std::string text =
        "\xEF\xBB\xBF<?xml version='1.0' encoding='UTF-16'?><a>" + russian + "</a>";
    EXPECT_EQ(TextOf(Encode(text, charset), "xml"), russian) << charset;
  }
}

TEST(Xml, NamedCharactersNeedNoDeclaration) {
  EXPECT_EQ(TextOf(kHead + "<a>&lt;x&gt; &#233; caf&eacute;</a>", "xml"),
            "<x> \xC3\xA9 caf\xC3\xA9");
}

TEST(Xml, EntitiesDoNotGrow) {
  std::string bomb = kHead + "<!DOCTYPE a [<!ENTITY e0 'ha'>";
  for (int i = 1; i < 30; ++i) {
    const std::string before = "&e" + std::to_string(i - 1) + ";";
    std::string ten;
    for (int j = 0; j < 10; ++j) ten += before;
    bomb += "<!ENTITY e" + std::to_string(i) + " '" + ten + "'>";
  }
  EXPECT_EQ(TextOf(bomb + "]><a x='&e29;'>before &e29; after</a>", "xml"), "before after");
}

TEST(Xml, ParameterEntitiesDoNotGrowEither) {
  EXPECT_EQ(TextOf(kHead + "<!DOCTYPE a [<!ENTITY % p '<!ENTITY q \"no\">'> %p; %p;]><a>&q; x</a>",
                   "xml"),
            "x");
}

TEST(Xml, OtherFilesAreNotRead) {
  const test::TempDir dir;
  test::WriteFile(dir / "secret", "secret");
  test::WriteFile(dir / "secret.dtd", "<!ENTITY s 'secret'>");
  const std::string uri = "file://" + (dir / "secret");
  EXPECT_EQ(TextOf(kHead + "<!DOCTYPE a [<!ENTITY s SYSTEM '" + uri + "'>]><a>x &s;</a>", "xml"),
            "x");
  EXPECT_EQ(TextOf(kHead + "<!DOCTYPE a SYSTEM '" + uri + ".dtd'><a>x &s;</a>", "xml"), "x");
  EXPECT_EQ(TextOf(kHead + "<!DOCTYPE a [<!ENTITY % p SYSTEM '" + uri + ".dtd'> %p;]><a>x &s;</a>",
                   "xml"),
            "x");
}

TEST(Xml, BrokenDocumentsGiveWhatThereIs) {
  EXPECT_EQ(TextOf(kHead + "<a>one<b>two</a>three", "xml"), "one\ntwo\nthree");
  EXPECT_EQ(TextOf(kHead + "<a>one", "xml"), "one");
  EXPECT_EQ(TextOf("no markup at all", "xml"), "no markup at all");
  EXPECT_EQ(TextOf("", "xml"), "");
}

TEST(Xml, DepthCostsNoStack) {
  std::string deep = kHead;
  for (int i = 0; i < 100000; ++i) deep += "<a>";
  EXPECT_EQ(TextOf(deep + "word", "xml"), "word");
}

TEST(Xml, LongTextsAreReadUpToTheBound) {
  std::string bytes = kHead + "<a>";
  while (bytes.size() < kMaxTextBytes + (4u << 20)) bytes += "some words in a row ";
  const std::string text = TextOf(bytes + "</a>", "xml");
  EXPECT_LE(text.size(), kMaxTextBytes);
  EXPECT_GT(text.size(), kMaxTextBytes - 100);
}

}  // namespace
}  // namespace quarry::extract
