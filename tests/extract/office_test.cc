// Office packages zipped by the test with libarchive: Word, Excel,
// PowerPoint, OpenDocument and EPUB properties and text, and zip bombs.
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "extract/test_files.h"
#include "zip_reader.h"

namespace orvex {
namespace extract {
namespace {

using testing::ExpectMembers;
using testing::Extract;
using testing::WriteZip;
using testing::ZipEntry;

const char kWordNs[] = "xmlns:w=\"http://schemas.openxmlformats.org/wordprocessingml/2006/main\"";

std::string WordDocument(const std::string& body) {
  return std::string("<?xml version=\"1.0\" encoding=\"UTF-8\" standalone=\"yes\"?>\n") +
         "<w:document " + kWordNs + "><w:body>" + body + "</w:body></w:document>";
}

std::string WordParagraph(const std::string& text) {
  return "<w:p><w:pPr><w:tabs><w:tab w:val=\"left\" w:pos=\"720\"/></w:tabs></w:pPr>"
         "<w:r><w:t xml:space=\"preserve\">" +
         text + "</w:t></w:r></w:p>";
}

const char kCoreProperties[] =
    "<?xml version=\"1.0\" encoding=\"UTF-8\" standalone=\"yes\"?>\n"
    "<cp:coreProperties "
    "xmlns:cp=\"http://schemas.openxmlformats.org/package/2006/metadata/core-properties\" "
    "xmlns:dc=\"http://purl.org/dc/elements/1.1/\" xmlns:dcterms=\"http://purl.org/dc/terms/\" "
    "xmlns:xsi=\"http://www.w3.org/2001/XMLSchema-instance\">"
    "<dc:title>Budget 2024</dc:title><dc:subject>Finance</dc:subject>"
    "<dc:creator>Grace Hopper</dc:creator><cp:keywords>budget, plan</cp:keywords>"
    "<dc:description>The yearly budget</dc:description>"
    "<dcterms:created xsi:type=\"dcterms:W3CDTF\">2022-05-06T07:08:09Z</dcterms:created>"
    "<dcterms:modified xsi:type=\"dcterms:W3CDTF\">2024-03-01T10:20:30Z</dcterms:modified>"
    "</cp:coreProperties>";

const char kAppProperties[] =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?><Properties "
    "xmlns=\"http://schemas.openxmlformats.org/officeDocument/2006/extended-properties\">"
    "<Application>Microsoft Office Word</Application><Pages>1</Pages></Properties>";

using OfficeTest = testing::ExtractTest;

TEST_F(OfficeTest, WordDocumentGivesCorePropertiesAndText) {
  const std::string path = dir_.Join("budget.docx");
  // Notes come after the body whatever their place in the archive.
  WriteZip(path, {{"[Content_Types].xml", "<Types/>"},
                  {"word/footnotes.xml", "<w:footnotes " + std::string(kWordNs) +
                                             "><w:footnote><w:p><w:r><w:t>A note"
                                             "</w:t></w:r></w:p></w:footnote></w:footnotes>"},
                  {"word/document.xml",
                   WordDocument(WordParagraph("Hello ") +
                                "<w:p><w:r><w:t>Spl</w:t></w:r><w:r><w:rPr><w:b/></w:rPr>"
                                "<w:t>it</w:t></w:r><w:r><w:tab/><w:t>word &amp; "
                                "caf\xC3\xA9</w:t><w:br/><w:t>line</w:t></w:r></w:p>")},
                  {"docProps/core.xml", kCoreProperties},
                  {"docProps/app.xml", kAppProperties}});
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  ExpectMembers(result.out, R"({"KALOMDTitle": "Budget 2024", "KALOMDAuthors": "Grace Hopper",
      "KALOMDDescription": "The yearly budget", "KALOMDKeywords": "budget, plan",
      "KALOMDContentCreationDate": 1651820889, "KALOMDContentModificationDate": 1709288430,
      "KALOMDCreator": "Microsoft Office Word"})");
  EXPECT_EQ("Hello\nSplit\tword & caf\xC3\xA9\nline\nA note",
            result.out["KALOMDTextContent"].asString());
}

TEST_F(OfficeTest, SpreadsheetAndSlidesGiveTheirText) {
  const std::string xlsx = dir_.Join("sheet.xlsx");
  WriteZip(xlsx, {{"xl/workbook.xml", "<workbook/>"},
                  {"xl/sharedStrings.xml",
                   "<sst xmlns=\"http://schemas.openxmlformats.org/spreadsheetml/2006/main\">"
                   "<si><t>Alpha</t></si><si><r><t>Be</t></r><r><t>ta</t></r></si>"
                   "<si><t>東京</t><rPh><t>トウキョウ</t></rPh></si></sst>"},
                  {"xl/worksheets/sheet1.xml",
                   "<worksheet><sheetData><row><c t=\"s\"><v>0</v></c><c t=\"inlineStr\"><is>"
                   "<t>Inline</t></is></c><c><f>SUM(A1)</f><v>42</v></c></row></sheetData>"
                   "</worksheet>"},
                  {"docProps/core.xml", kCoreProperties}});
  const std::string a = "xmlns:a=\"http://schemas.openxmlformats.org/drawingml/2006/main\"";
  const auto slide = [&](const std::string& text) {
    return "<p:sld xmlns:p=\"p\" " + a + "><a:p><a:r><a:t>" + text + "</a:t></a:r></a:p></p:sld>";
  };
  const std::string pptx = dir_.Join("deck.pptx");
  // Archive order is not reading order: slide 10 comes after slide 2.
  WriteZip(pptx, {{"ppt/presentation.xml", "<p:presentation xmlns:p=\"p\"/>"},
                  {"ppt/slides/slide10.xml", slide("Ten")},
                  {"ppt/slides/slide2.xml", slide("Two")},
                  {"ppt/slides/slide1.xml", slide("One")},
                  {"ppt/notesSlides/notesSlide1.xml", slide("Speaker note")},
                  {"ppt/slides/_rels/slide1.xml.rels", "<Relationships/>"}});
  struct Case {
    std::string path;
    std::string text;
  };
  for (const Case& c :
       {Case{xlsx, "Alpha\nBeta\n東京\nInline"}, Case{pptx, "One\nTwo\nTen\nSpeaker note"}}) {
    SCOPED_TRACE(c.path);
    const auto result = Extract(c.path);
    ASSERT_TRUE(result.ok) << result.problem;
    EXPECT_EQ(c.text, result.out["KALOMDTextContent"].asString());
  }
  EXPECT_EQ("Budget 2024", Extract(xlsx).out["KALOMDTitle"].asString());
}

TEST_F(OfficeTest, OpenDocumentGivesMetaAndText) {
  const std::string path = dir_.Join("letter.odt");
  WriteZip(path,
           {{"mimetype", "application/vnd.oasis.opendocument.text"},
            {"content.xml",
             "<?xml version=\"1.0\" encoding=\"UTF-8\"?><office:document-content "
             "xmlns:office=\"urn:oasis:names:tc:opendocument:xmlns:office:1.0\" "
             "xmlns:text=\"urn:oasis:names:tc:opendocument:xmlns:text:1.0\">"
             "<office:automatic-styles/><office:body><office:text>"
             "<text:h text:outline-level=\"1\">Dear reader</text:h>"
             "<text:p>Two<text:s text:c=\"3\"/>spaces and a<text:tab/>tab.</text:p>\n  "
             "<text:p>Line<text:line-break/>break <text:span>in a span</text:span></text:p>"
             "</office:text></office:body></office:document-content>"},
            {"meta.xml",
             "<?xml version=\"1.0\" encoding=\"UTF-8\"?><office:document-meta "
             "xmlns:office=\"urn:oasis:names:tc:opendocument:xmlns:office:1.0\" "
             "xmlns:meta=\"urn:oasis:names:tc:opendocument:xmlns:meta:1.0\" "
             "xmlns:dc=\"http://purl.org/dc/elements/1.1/\"><office:meta>"
             "<meta:generator>LibreOffice/7.4</meta:generator><dc:title>A letter</dc:title>"
             "<dc:description>To a friend</dc:description>"
             "<meta:initial-creator>Ada Lovelace</meta:initial-creator>"
             "<dc:creator>Someone Else</dc:creator>"
             "<meta:keyword>letter</meta:keyword><meta:keyword>friend</meta:keyword>"
             "<meta:creation-date>2021-12-31T00:00:00</meta:creation-date>"
             "<dc:date>2024-03-01T10:20:30.5</dc:date></office:meta></office:document-meta>"}});
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  ExpectMembers(result.out, R"({"KALOMDTitle": "A letter", "KALOMDAuthors": "Ada Lovelace",
      "KALOMDDescription": "To a friend", "KALOMDKeywords": "letter, friend",
      "KALOMDCreator": "LibreOffice/7.4", "KALOMDContentCreationDate": 1640908800,
      "KALOMDContentModificationDate": 1709288430,
      "KALOMDTextContent": "Dear reader\nTwo spaces and a\ttab.\nLine\nbreak in a span"})");
}

TEST_F(OfficeTest, EpubFollowsTheSpine) {
  const std::string path = dir_.Join("book.epub");
  const auto chapter = [](const std::string& title, const std::string& body) {
    return "<?xml version=\"1.0\" encoding=\"utf-8\"?><html "
           "xmlns=\"http://www.w3.org/1999/xhtml\"><head><title>" +
           title + "</title></head><body>" + body + "</body></html>";
  };
  WriteZip(path,
           {{"mimetype", "application/epub+zip"},
            {"META-INF/container.xml",
             "<?xml version=\"1.0\"?><container version=\"1.0\" "
             "xmlns=\"urn:oasis:names:tc:opendocument:xmlns:container\"><rootfiles>"
             "<rootfile full-path=\"OEBPS/content.opf\" "
             "media-type=\"application/oebps-package+xml\"/></rootfiles></container>"},
            {"OEBPS/Text/ch 2.xhtml", chapter("Two", "<p>Second chapter.</p>")},
            {"OEBPS/Text/notes.xhtml", chapter("Notes", "<p>Not in the spine.</p>")},
            {"OEBPS/Text/ch1.xhtml", chapter("One", "<h1>Start</h1><p>First chapter.</p>")},
            {"OEBPS/content.opf",
             "<?xml version=\"1.0\"?><package xmlns=\"http://www.idpf.org/2007/opf\" "
             "version=\"3.0\"><metadata xmlns:dc=\"http://purl.org/dc/elements/1.1/\">"
             "<dc:title>The Book</dc:title><dc:creator>Ann Author</dc:creator>"
             "<dc:creator>Bob Writer</dc:creator><dc:identifier>urn:isbn:9780000000001"
             "</dc:identifier><dc:subject>fiction</dc:subject><dc:date>2021-12-31</dc:date>"
             "</metadata><manifest>"
             "<item id=\"c2\" href=\"Text/ch%202.xhtml\" media-type=\"application/xhtml+xml\"/>"
             "<item id=\"c1\" href=\"./Text/ch1.xhtml\" media-type=\"application/xhtml+xml\"/>"
             "<item id=\"n\" href=\"Text/notes.xhtml\" media-type=\"application/xhtml+xml\"/>"
             "</manifest><spine><itemref idref=\"c1\"/><itemref idref=\"c2\"/></spine>"
             "</package>"}});
  const auto result = Extract(path);
  ASSERT_TRUE(result.ok) << result.problem;
  ExpectMembers(result.out, R"({"KALOMDTitle": "The Book",
      "KALOMDAuthors": "Ann Author, Bob Writer", "KALOMDIdentifier": "urn:isbn:9780000000001",
      "KALOMDKeywords": "fiction", "KALOMDContentCreationDate": 1640908800,
      "KALOMDTextContent": "Start\nFirst chapter.\nSecond chapter."})");
}

TEST_F(OfficeTest, TextCapCutsAtACharacterBoundary) {
  const std::string path = dir_.Join("capped.docx");
  std::string body;
  for (int i = 0; i < 100; ++i) body += WordParagraph("\xC3\xA9t\xC3\xA9");  // "été": 5 bytes
  WriteZip(path, {{"word/document.xml", WordDocument(body)}});
  struct Case {
    size_t cap;
    std::string text;
  };
  const std::vector<Case> cases = {
      {13, "\xC3\xA9t\xC3\xA9\n\xC3\xA9t\xC3\xA9"},
      {14, "\xC3\xA9t\xC3\xA9\n\xC3\xA9t\xC3\xA9\n\xC3\xA9"},
      {15, "\xC3\xA9t\xC3\xA9\n\xC3\xA9t\xC3\xA9\n\xC3\xA9t"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE("cap " + std::to_string(c.cap));
    const auto result = Extract(path, c.cap);
    ASSERT_TRUE(result.ok) << result.problem;
    EXPECT_EQ(c.text, result.out["KALOMDTextContent"].asString());
  }
}

// Writes a docx whose document.xml inflates to prefix, about `bytes` of
// `unit` repeated, and tail, from a few hundred kilobytes of zip; its core
// properties come after it in the archive.
void WriteBomb(const std::string& path, const std::string& prefix, const std::string& unit,
               const std::string& tail, int64_t bytes) {
  const std::string whole = WordDocument("");
  const std::string open = whole.substr(0, whole.find("</w:body>")) + prefix;
  const std::string close = tail + "</w:body></w:document>";
  const int64_t units = bytes / static_cast<int64_t>(unit.size());
  const int64_t size =
      static_cast<int64_t>(open.size() + close.size()) + units * static_cast<int64_t>(unit.size());
  const ZipEntry document("word/document.xml", size, [&](const auto& write) {
    write(open);
    std::string block;
    for (int i = 0; i < 4096; ++i) block += unit;
    int64_t left = units;
    for (; left >= 4096; left -= 4096) write(block);
    for (; left > 0; --left) write(unit);
    write(close);
  });
  WriteZip(path, {document, {"docProps/core.xml", kCoreProperties}});
}

TEST_F(OfficeTest, ZipBombStopsAtTheCap) {
  struct Case {
    const char* name;
    const char* prefix;
    const char* unit;
    const char* tail;
    bool fills_cap;
  };
  // Text fills the cap at once; markup or blanks without text inflate
  // until the budget runs out, never reaching the end of the part.
  const char* const kLastParagraph = "<w:p><w:r><w:t>LAST</w:t></w:r></w:p>";
  const std::vector<Case> cases = {
      {"paragraphs.docx", "", "<w:p><w:r><w:t>bomb bomb bomb</w:t></w:r></w:p>", kLastParagraph,
       true},
      {"markup.docx", "", "<w:p><w:r><w:rPr><w:b/></w:rPr></w:r></w:p>", kLastParagraph, false},
      {"one-text-node.docx", "<w:p><w:r><w:t>", "abcd", "LAST</w:t></w:r></w:p>", true},
      {"blanks.docx", "<w:p><w:r><w:t>", "    ", "LAST</w:t></w:r></w:p>", false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string path = dir_.Join(c.name);
    WriteBomb(path, c.prefix, c.unit, c.tail, int64_t{64} << 20);
    const auto result = Extract(path, 4096);
    EXPECT_TRUE(result.ok) << result.problem;
    const std::string text = result.out.get("KALOMDTextContent", "").asString();
    EXPECT_LE(text.size(), 4096u);
    if (c.fills_cap) {
      EXPECT_GE(text.size(), 4000u);
    }
    EXPECT_EQ(std::string::npos, text.find("LAST"));
    // Properties after the bomb in the archive are still read.
    EXPECT_EQ("Budget 2024", result.out["KALOMDTitle"].asString());
  }
}

TEST_F(OfficeTest, ZipReaderSpendsNoMoreThanItsBudget) {
  const std::string path = dir_.Join("bomb.docx");
  WriteBomb(path, "", "<w:p/>", "", int64_t{64} << 20);
  for (uint64_t budget : {uint64_t{0}, uint64_t{1000}, uint64_t{1} << 20}) {
    SCOPED_TRACE("budget " + std::to_string(budget));
    ZipReader zip(budget);
    std::string problem;
    ASSERT_TRUE(zip.Open(path, &problem)) << problem;
    std::string name;
    ASSERT_TRUE(zip.Next(&name));
    EXPECT_EQ("word/document.xml", name);
    EXPECT_GT(zip.declared_size(), int64_t{60} << 20);
    uint64_t total = 0;
    char buf[8192];
    for (ssize_t n; (n = zip.Read(buf, sizeof(buf))) > 0;) total += static_cast<uint64_t>(n);
    EXPECT_EQ(budget, total);
    EXPECT_TRUE(zip.exhausted());
    std::string all;
    EXPECT_FALSE(zip.ReadAll(1 << 20, &all));  // claims more than the limit
  }
}

}  // namespace
}  // namespace extract
}  // namespace orvex
