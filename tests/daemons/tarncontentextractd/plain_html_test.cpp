// The short way through plain pages beside the parser's, which is right by definition.

#include "daemons/tarncontentextractd/plain_html.h"

#include <gtest/gtest.h>

#include <optional>
#include <random>

#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

std::optional<Fields> ShortWay(const std::string& page) {
  Extraction found;
  HtmlReader reader(found.text(), &found);
  if (!ReadPlainHtml(page, reader)) return std::nullopt;
  return ToMap(found.Take());
}

Fields LongWay(const std::string& page) {
  Extraction found;
  HtmlReader reader(found.text(), &found);
  ReadHtml(page, reader);
  return ToMap(found.Take());
}

// Returns whether the short way was gone, and sees to it that it ended where the long one does.
bool BothAgree(const std::string& page) {
  const std::optional<Fields> found = ShortWay(page);
  if (found) {
    EXPECT_EQ(*found, LongWay(page)) << page;
  }
  return found.has_value();
}

std::string PageOf(const std::string& body) {
  return "<!DOCTYPE html><html><head><title>t</title></head><body>" + body + "</body></html>";
}

// As programs write pages.
constexpr char kPage[] = R"(<!DOCTYPE html>
<html class="writer-html5" lang="en" >
<head>
  <meta charset="utf-8" /><meta name="generator" content="Writer 0.19: https://example.org/" />
  <meta content="Some&amp;one" name="Author"><meta property="og:title" content='Social' />
  <meta name="keywords" content="a, b"><meta name="description" content="What &lt;it&gt; is">
  <title>3Com &mdash; The &#75;ernel  documentation</title>
  <!-- A remark, with <tags> - and so on. -->
  <link rel="next" title="Linux &quot;kernel&quot;" href="../ena.html" />
  <script async data-root="./" src="a.js"></script><style>p > a { color: red }</style>
</head>

<body class="body"> 
  <nav data-toggle='shift' class="side"><form id="f"><input type="text" name="q"/></form></nav>
  <section id="s"><h1>Title<a class="headerlink" href="#s" title="Link">)"
                         "\xC2\xB6"
                         R"(</a></h1>
<p>Some <em>words <strong>of</strong> text</em>, 1 &gt; 0 &amp;&#38; 2&#160;&lt; 3.<br />Next<br>
line<!-- not here -->. <img src="x.png" alt="A &quot;picture&quot;"> <img alt='' src=""/>
<code class="docutils"><span class="pre">span</span></code> <kbd><kbd>Ctrl</kbd>-<kbd>C</kbd></kbd></p>
<blockquote><div><ul class="simple"><li><p>one</p></li><li>two<ul><li>three</li></ul></li></ul>
</div></blockquote><dl class="field"><dt>Term<span>:</span></dt><dd><p>What it is</p></dd></dl>
<table><colgroup><col style="width: 33%" /><col></colgroup><thead><tr><th>h</th><th>i</th></tr>
</thead><tbody><tr><td>c</td><td><p>d</p></td></tr></tbody></table><hr/><pre>  a
    b </pre><h2>H<sub>2</sub>O</h2><ol><li></li></ol></section>
  <script>
      if (1 < 2) { run("<b>".length); }
  </script>
  <script>jQuery(function () { a < b; });</script><div><footer>&copy; &#xA9; nobody</footer></div>
</body>
</html>
)";

TEST(PlainHtml, APageThatAProgramWroteIsRead) {
  ASSERT_TRUE(BothAgree(kPage));
  const Fields fields = *ShortWay(kPage);
  EXPECT_EQ(fields.at("TARNMDTitle"), "3Com \xE2\x80\x94 The Kernel documentation");
  EXPECT_EQ(fields.at("TARNMDAuthors"), "Some&one");
  EXPECT_EQ(fields.at("TARNMDDescription"), "What <it> is");
  EXPECT_NE(fields.at("TARNMDTextContent").find("1 > 0 && 2 < 3.\nNext\nline. A \"picture\""),
            std::string::npos);
}

TEST(PlainHtml, APageMayBeLittle) {
  EXPECT_TRUE(BothAgree("<html></html>"));
  EXPECT_TRUE(BothAgree(" \n<!doctype html >\n<html><body>words</body></html>\n"));
  EXPECT_TRUE(BothAgree("<html><head></head></html>"));
}

TEST(PlainHtml, WhatHasToBeGuessedIsLeftToTheParser) {
  for (const char* page : {"",
                           "words",
                           "<p>words</p>",
                           "<html>",
                           "<html><body>words",
                           "<html><body><p>a</body></html>",
                           "<html>words</html>",
                           "<html><body></body>words</html>",
                           "<html><body></body></html>words",
                           "<html><body></body></html><p>",
                           "<html><head>words</head></html>",
                           "<html><p>words</p></html>",
                           "<html><body></body><body></body></html>",
                           "<html><head></head><head></head></html>",
                           "<html><body></body><head></head></html>",
                           "<html><html></html></html>",
                           "<html><!-- a",
                           "<html><!--> --></html>",
                           "<!-- a --><!DOCTYPE html><html></html>",
                           "<html><!-- a --!> b --></html>",
                           "<html><!DOCTYPE html></html>",
                           "<?xml version='1.0'?><html></html>",
                           "<!DOCTYPE html PUBLIC \"x\"><html></html>",
                           "\xEF\xBB\xBF<html></html>",
                           "<!DOCTYPE HTML><html></html>",
                           "<HTML></HTML>"}) {
    EXPECT_FALSE(ShortWay(page)) << page;
  }
  for (const char* body : {"a < b",
                           "a & b",
                           "a &amp b",
                           "&nonesuch;",
                           "&#0;",
                           "&#8;",
                           "&#xD800;",
                           "&#x110000;",
                           "&#;",
                           "<b>a</i>",
                           "</p>",
                           "<p>a<p>b</p></p>",
                           "<p a=b></p>",
                           "<p a=\"b\"c=\"d\"></p>",
                           "<p a=\"></p>",
                           "<p / a=\"b\"></p>",
                           "<p A=\"b\"></p>",
                           "<P></P>",
                           "<p></p >",
                           "<p",
                           "<p></",
                           "<x></x>",
                           "<img alt>",
                           "<img alt=\"&nonesuch;\">",
                           "<img alt=\"a&#xFFFE;b\">",
                           "<meta name=\"author\" content=\"a&#65535;b\">",
                           "<textarea></textarea>",
                           "<svg></svg>",
                           "<math></math>",
                           "<noscript></noscript>",
                           "<iframe></iframe>",
                           "<template></template>",
                           "<plaintext></plaintext>",
                           "<xmp></xmp>",
                           "<!---->",
                           "<br></br>",
                           "<title>a<b>c</b></title>",
                           "<script><!-- --></script>",
                           "<script></SCRIPT></script>",
                           "<script></script ></script>",
                           "<script>",
                           "<script>\"</b>\"</script>",
                           "<![CDATA[a]]>",
                           "<?php ?>",
                           "\x01",
                           "\x0C",
                           "\x1B",
                           "\xFF",
                           "\xC3",
                           "\xED\xA0\x80"}) {
    EXPECT_FALSE(ShortWay(PageOf(body))) << body;
  }
  EXPECT_FALSE(ShortWay(PageOf(std::string(kMaxTextBytes, 'a')))) << "not all of it is wanted";
  std::string deep;
  for (int i = 0; i < 100000; ++i) deep += "<div>";
  EXPECT_FALSE(ShortWay(PageOf(deep)));
}

TEST(PlainHtml, ElementsWithinEachOtherAreWhatTheParserTakesThemFor) {
  const std::vector<std::string> names{
      "a",    "abbr",     "acronym",    "address",    "article", "aside",   "b",       "bdi",
      "bdo",  "big",      "body",       "blockquote", "br",      "caption", "center",  "cite",
      "code", "col",      "colgroup",   "dd",         "del",     "dfn",     "div",     "dl",
      "dt",   "em",       "figcaption", "figure",     "font",    "footer",  "form",    "h1",
      "h2",   "h3",       "h4",         "h5",         "h6",      "head",    "header",  "hr",
      "html", "i",        "iframe",     "img",        "input",   "ins",     "kbd",     "label",
      "li",   "link",     "main",       "mark",       "meta",    "nav",     "ol",      "option",
      "p",    "pre",      "q",          "s",          "samp",    "script",  "section", "small",
      "span", "strike",   "strong",     "style",      "sub",     "sup",     "table",   "tbody",
      "td",   "template", "tfoot",      "th",         "thead",   "title",   "tr",      "tt",
      "u",    "ul",       "var",        "wbr"};
  std::size_t plain = 0;
  const auto tag = [](const std::string& name) { return "<" + name + ">"; };
  const auto end = [](const std::string& name) { return "</" + name + ">"; };
  for (const std::string& outer : names) {
    plain += BothAgree(PageOf("1" + tag(outer) + "2" + end(outer) + "3")) ? 1 : 0;
    plain += BothAgree(PageOf("1" + tag(outer) + "2")) ? 1 : 0;
    for (const std::string& inner : names) {
      const std::string both = tag(outer) + "2" + tag(inner) + "3";
      plain += BothAgree(PageOf("1" + both + end(inner) + "4" + end(outer) + "5")) ? 1 : 0;
      plain += BothAgree(PageOf("1" + both + end(outer) + "5")) ? 1 : 0;
      BothAgree("<html><head>" + both + end(inner) + end(outer) + "</head></html>");
    }
  }
  EXPECT_GT(plain, 2000u);
}

// Oddities in which nothing is left to guess.
TEST(PlainHtml, WhatIsOddButPlainIsReadAlike) {
  for (const char* body :
       {"<form><div><form>a</form>b</div></form>c", "<a>x<span><a>y</a>z</span></a>",
        "<table>q<tr>w<td><table><tr><td>e</td></tr></table></td>r</tr>t</table>",
        "<td>x</td>y<tr>z</tr><li>a<p>b</p></li>",
        "<img alt=\"a\" alt=\"b\"><img alt=\"a>b<c\r\nd\" alt=\"\">",
        "<meta name=\"author\" name=\"keywords\" content=\"x\" content=\"y\">",
        "<meta charset=\"utf-16\"><meta content=\"text/html; charset=latin1\">"
        "\xC3\xA9\xEF\xBB\xBF\xE2\x80\xA8\xF0\x9F\x98\x80",
        "<pre>\r\n\r\n a\rb</pre>c", "a<p/>b<div/>c<script/>d<title/>e<ul/>f",
        "a<title>b&amp;<!-- c -->d</title>e<title>f</title>", "a<!-- -->b<!-- > < & -->c]]>d",
        "&#128;&#x1FFFF;&#X41;&#000065;&#127;&thetasym;&apos;"}) {
    EXPECT_TRUE(BothAgree(PageOf(body))) << body;
  }
  EXPECT_TRUE(BothAgree("<html/>"));
  EXPECT_TRUE(BothAgree("<html><head/><body/></html>"));
  EXPECT_TRUE(BothAgree(
      "<html><!--a--><head><!--b--></head><!--c--><body>x</body><!--d--></html><!--e-->"));
  const auto repeated = [](const std::string& piece, int times) {
    std::string all;
    while (times-- > 0) all += piece;
    return all;
  };
  EXPECT_TRUE(BothAgree(PageOf(repeated("<div>", 900) + "x" + repeated("</div>", 900) + "y")));
  EXPECT_TRUE(BothAgree(PageOf("<img alt=\"" + repeated("word ", 100000) + "\">after")));
  EXPECT_TRUE(BothAgree("<html><head><title>" + repeated("\xC3\xA9 ab", 10000) +
                        "</title></head><body>x</body></html>"));
  EXPECT_TRUE(BothAgree(PageOf("<p" + repeated(" a=\"b\"", 1000) + ">x</p>")));
}

// Pages of elements in each other, whatever they are, closed in their order.
class PageMaker {
 public:
  explicit PageMaker(unsigned seed) : random_(seed) {}

  std::string Content(int levels) {
    std::string content;
    for (std::size_t count = Pick(5); count > 0; --count) {
      content += levels == 0 || Pick(2) == 0 ? OneOf(kBits) : Element(levels);
    }
    return content;
  }

 private:
  using Pieces = std::vector<std::string>;

  std::size_t Pick(std::size_t count) { return random_() % count; }
  const std::string& OneOf(const Pieces& pieces) { return pieces[Pick(pieces.size())]; }

  std::string Element(int levels) {
    const std::string& name = OneOf(kNames);
    std::string element = "<" + name;
    for (std::size_t count = Pick(4); count > 0; --count) {
      element += " " + OneOf(kKeys) + "=\"" + OneOf(kValues) + "\"";
    }
    if (name == "br" || name == "img" || name == "meta" || Pick(25) == 0) return element + "/>";
    return element + ">" + Content(name == "title" ? 0 : levels - 1) + "</" + name + ">";
  }

  const Pieces kNames{"a",     "b",     "code", "dd",   "div", "dl",    "dt",    "form", "h1",
                      "img",   "br",    "li",   "meta", "nav", "p",     "pre",   "q",    "span",
                      "table", "tbody", "td",   "th",   "tr",  "title", "style", "ul",   "script"};
  const Pieces kBits{
      " ",      "\r\n",   "words",  "\xC3\xA9",    "\xEF\xBF\xBE", "\x7F",     "&amp;",
      "&nbsp;", "&#x85;", "&#128;", "&#xFFFF;",    "&apos;",       "<!-- -->", "<!-- > \xC2\x85-->",
      "]]>",    "\"",     "'",      "\xE2\x80\xA8"};
  const Pieces kKeys{"id", "name", "content", "alt", "property", "charset"};
  const Pieces kValues{"",      "author",   "Keywords", "og:title",      "generator",  " a\nb ",
                       "a>b<c", "it&#39;s", "&nbsp;",   "&#xFFFE;after", "description"};
  std::mt19937 random_;
};

TEST(PlainHtml, PagesMadeAtRandomAreReadAlike) {
  PageMaker maker(11);
  std::size_t plain = 0;
  for (int round = 0; round < 20000; ++round) {
    plain += BothAgree(PageOf(maker.Content(1 + round % 6))) ? 1 : 0;
  }
  EXPECT_GT(plain, 5000u);
}

TEST(PlainHtml, EveryBeginningOfAPageIsReadAlike) {
  const std::string page = kPage;
  for (std::size_t size = 0; size <= page.size(); ++size) BothAgree(page.substr(0, size));
}

TEST(PlainHtml, PagesChangedAtRandomAreReadAlike) {
  const std::vector<std::string> pieces{
      "<p>",     "</p>",  "<br/>",  "<",       ">",  "/",         "\"",           "&",    "&amp;",
      "&lt",     ";",     "<!--",   "-->",     "--", " ",         "\n",           "\xC3", "\xA9",
      "<li>",    "</ul>", "=",      "<title>", "a",  "</script>", "<a href='x'>", "</a>", "<b>",
      "<table>", "<td>",  "<div/>", "'",       "!",  "\r",        "\t",           "\x0B", "&#10;"};
  const std::string page = kPage;
  std::mt19937 random(5);
  const auto pick = [&random](std::size_t count) { return random() % count; };
  std::size_t plain = 0;
  for (int round = 0; round < 20000; ++round) {
    std::string changed = page;
    for (std::size_t changes = 1 + pick(3); changes > 0; --changes) {
      const std::size_t at = pick(changed.size());
      switch (pick(4)) {
        case 0:
          changed.insert(at, pieces[pick(pieces.size())]);
          break;
        case 1:
          changed.erase(at, 1 + pick(12));
          break;
        case 2:
          changed.replace(at, 1, pieces[pick(pieces.size())]);
          break;
        default:
          changed.insert(at, changed.substr(pick(changed.size()), pick(80)));
      }
    }
    plain += BothAgree(changed) ? 1 : 0;
  }
  EXPECT_GT(plain, 2000u);
}

}  // namespace
}  // namespace quarry::extract
