// PDF (a hand-written document with an information dictionary) and HTML
// pages: their properties and text.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "extract/test_files.h"

namespace orvex {
namespace extract {
namespace {

using testing::ExpectMembers;
using testing::Extract;
using testing::MinimalPdf;
using PdfTest = testing::ExtractTest;
using HtmlTest = testing::ExtractTest;

TEST_F(PdfTest, ReadsInformationAndPageText) {
  const std::string info =
      "/Title (Quarterly Report) /Author <FEFF005A006F00EB> /Subject (Sales in Q3) "
      "/Keywords (revenue forecast) /Creator (Orvex Writer) /Producer (Some Library) "
      "/CreationDate (D:20240301102030Z) /ModDate (D:20240302000000+01'00')";
  const auto result = Extract(dir_.Write("report.pdf", MinimalPdf(info, "Hello PDF world")));
  ASSERT_TRUE(result.ok) << result.problem;
  // The author is UTF-16 in the file.
  ExpectMembers(result.out, R"({"KALOMDTitle": "Quarterly Report", "KALOMDAuthors": "Zoë",
      "KALOMDDescription": "Sales in Q3", "KALOMDKeywords": "revenue forecast",
      "KALOMDCreator": "Orvex Writer", "KALOMDContentCreationDate": 1709288430,
      "KALOMDContentModificationDate": 1709334000, "KALOMDTextContent": "Hello PDF world"})");
}

TEST_F(PdfTest, TextStopsAtTheCap) {
  const auto result =
      Extract(dir_.Write("long.pdf", MinimalPdf("/Title (T)", "Hello PDF world")), 8);
  ASSERT_TRUE(result.ok) << result.problem;
  EXPECT_EQ("Hello PD", result.out["KALOMDTextContent"].asString());
}

TEST_F(PdfTest, MissingInformationIsLeftOut) {
  const auto result = Extract(dir_.Write("bare.pdf", MinimalPdf("", "Just text")));
  ASSERT_TRUE(result.ok) << result.problem;
  ExpectMembers(result.out, R"({"KALOMDTextContent": "Just text", "KALOMDTitle": null,
      "KALOMDAuthors": null, "KALOMDContentCreationDate": null})");
}

TEST_F(HtmlTest, ReadsTitleAndBodyText) {
  struct Case {
    const char* name;
    std::string page;
    std::string title;
    std::string text;
  };
  const std::vector<Case> cases = {
      {"page.html",
       "<!DOCTYPE html><html><head><meta charset=\"utf-8\"><title>Orvex &amp; Co \xE2\x80\x94 "
       "Home</title><style>p { color: red }</style><script>var hidden = 1;</script></head>"
       "<body><h1>Welcome</h1><p>First <b>bold</b>\n   paragraph</p>"
       "<ul><li>one</li><li>two</li></ul><table><tr><td>a</td><td>b</td></tr></table>"
       "<p>caf\xC3\xA9<br>next line</p></body></html>",
       "Orvex & Co \xE2\x80\x94 Home",
       "Welcome\nFirst bold paragraph\none\ntwo\na\tb\ncaf\xC3\xA9\nnext line"},
      {"latin1.htm",
       "<html><head><meta http-equiv=\"Content-Type\" content=\"text/html; "
       "charset=iso-8859-1\"><title>Caf\xE9</title></head><body><p>cr\xE8me</p></body></html>",
       "Caf\xC3\xA9", "cr\xC3\xA8me"},
      {"sloppy.html", "<title>Loose</title><p>one<p>two <i>three<div>four", "Loose",
       "one\ntwo three\nfour"},
      {"notitle.html", "<p>only &lt;text&gt;</p>", "", "only <text>"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const auto result = Extract(dir_.Write(c.name, c.page));
    EXPECT_TRUE(result.ok) << result.problem;
    EXPECT_EQ(c.title, result.out.get("KALOMDTitle", "").asString());
    EXPECT_EQ(c.text, result.out.get("KALOMDTextContent", "").asString());
  }
}

TEST_F(HtmlTest, StopsAtTheCap) {
  std::string page = "<html><head><title>Big</title></head><body>";
  for (int i = 0; i < 200000; ++i) page += "<p>paragraph " + std::to_string(i) + "</p>";
  page += "</body></html>";
  const auto result = Extract(dir_.Write("big.html", page), 100);
  ASSERT_TRUE(result.ok) << result.problem;
  EXPECT_EQ("Big", result.out["KALOMDTitle"].asString());
  const std::string text = result.out["KALOMDTextContent"].asString();
  EXPECT_LE(text.size(), 100u);
  EXPECT_EQ(0u, text.find("paragraph 0\nparagraph 1\nparagraph 2\n")) << text;
}

}  // namespace
}  // namespace extract
}  // namespace orvex
