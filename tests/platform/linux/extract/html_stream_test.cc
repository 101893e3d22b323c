// The streaming HTML reader gives the text and head fields a walk of the
// parser's tree gave: each page of the table, fed in pieces of several sizes,
// and one large page read piece by piece.
#include <gtest/gtest.h>

#include <string>

#include "platform/linux/extract/parsers/html_text.h"
#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

struct PageRead {
  std::string text;
  HtmlHeadFields head;
};

PageRead Read(const std::string& page, size_t chunk, size_t cap = kTextContentCap) {
  TextSink text(cap);
  PageRead read;
  EXPECT_TRUE(ReadHtmlStream(page.data(), page.size(), chunk, text, read.head));
  read.text = text.Trimmed();
  return read;
}

struct PageCase {
  const char* name;
  std::string page;
  std::string text;
  std::string head = "|||";  // "title|description|author|keywords"
};

TEST(HtmlStreamTest, PagesGiveTheTextAndHeadOfTheirTree) {
  const PageCase cases[] = {
      {"unclosed tags end their lines where the parser closes them",
       "<html><body><p>one<p>two<li>three<div>four<table><tr><td>five", "one\ntwo\nthree\nfour\nfive"},
      {"entities decoded, unknown ones kept as written", "<p>&amp; &lt;b&gt; caf&eacute; &#x20AC; &bogus; AT&T</p>",
       "& <b> caf\xC3\xA9 \xE2\x82\xAC &bogus; AT&T"},
      {"nested noscript kept, the script inside it not",
       "<body><noscript>a<noscript>b<script>c</script>d</noscript>e</noscript>f</body>", "abdef"},
      {"text after </html> kept", "<html><body><p>inside</p></body></html>\n<p>after the end</p> tail",
       "inside\nafter the end\n tail"},
      {"head, style, script and template dropped; the title read",
       "<html><head><title>Page</title><style>p{}</style><script>var x;</script></head>"
       "<body>body<template>t</template></body></html>",
       "body", "Page|||"},
      {"the last meta of a name wins; one in the body does not count",
       "<html><head><meta name=\"author\" content=\"first\"><meta name=\"AUTHOR\" content=\"second\">"
       "<meta name=\"Keywords\" content=\"k\"></head><body><meta name=\"description\" content=\"in body\">x</body>"
       "</html>",
       "x", "||second|k"},
      {"a meta without content empties its name", "<head><meta name=\"author\" content=\"a\"><meta name=\"author\"></head>x",
       "x"},
      {"a title after </html> belongs to the root", "<html><body><p>in</p></body></html><title>late title</title>",
       "in\nlate title", "late title|||"},
      {"after a doctype the tail stands beside the root",
       "<!DOCTYPE html><html><body>x</body></html><title>late</title><meta name=\"author\" content=\"late\">",
       "x\nlate"},
      {"only the first title counts, with everything inside it",
       "<html><head><title>a<script>b</script>c</title><title>second</title></head><body>x</body></html>", "x",
       "abc|||"},
      {"a page nested past the parser's depth stops there", "<body>" + [] {
         std::string deep;
         for (int i = 0; i < 300; ++i) deep += "<span>a";
         return deep;
       }() + "lost",
       std::string(255, 'a')},
  };
  for (const PageCase& c : cases) {
    for (size_t chunk : {size_t{1}, size_t{4096}, kHtmlChunk}) {
      SCOPED_TRACE(std::string(c.name) + ", chunk " + std::to_string(chunk));
      const PageRead read = Read(c.page, chunk);
      EXPECT_EQ(c.text, read.text);
      const HtmlHeadFields& h = read.head;
      EXPECT_EQ(c.head, h.title + "|" + h.description + "|" + h.author + "|" + h.keywords);
    }
  }
}

TEST(HtmlStreamTest, LargePageReadInPiecesGivesEveryPiecesText) {
  // About 2.4 MB: hundreds of pieces, with tags, entities and scripts cut
  // at every kind of place by the piece boundaries.
  std::string page = "<!DOCTYPE html><html><head><title>Large</title></head><body>\n";
  std::string expected;
  for (int i = 0; i < 20000; ++i) {
    const std::string n = std::to_string(i);
    page += "<h2>Section " + n + "</h2><p>word" + n + " &amp; caf&eacute;</p><script>var s" + n +
            " = '</p>';</script><noscript>ns " + n + "</noscript>\n";
    expected += "Section " + n + "\nword" + n + " & caf\xC3\xA9\nns " + n + "\n";
  }
  page += "</body></html><p>after the end</p>";
  expected += "after the end";
  for (size_t chunk : {size_t{4096}, size_t{100000}, kHtmlChunk, page.size()}) {
    SCOPED_TRACE("chunk " + std::to_string(chunk));
    const PageRead read = Read(page, chunk);
    EXPECT_EQ(expected.size(), read.text.size());
    EXPECT_TRUE(expected == read.text);
    EXPECT_EQ("Large", read.head.title);
  }
}

TEST(HtmlStreamTest, TextStopsAtTheCapWhileTheHeadIsStillRead) {
  const PageRead read =
      Read("<html><head><title>T</title></head><body><p>caf\xC3\xA9 " + std::string(100, 'x') +
               "</p></body></html><meta name=\"author\" content=\"late\">",
           4096, 4);
  EXPECT_EQ("caf", read.text);  // the two bytes of the "é" would cross the cap
  EXPECT_EQ("T", read.head.title);
  EXPECT_EQ("late", read.head.author);
}

}  // namespace
}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
