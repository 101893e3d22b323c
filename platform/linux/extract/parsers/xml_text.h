// Text of XML and HTML trees for the markup and office formats.
#pragma once

#include <libxml/tree.h>

#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

class TextSink;

// Parse options for untrusted documents: no network, no external entities
// or DTDs, no entity substitution, quiet, tolerant of errors.
int SafeXmlOptions();
int SafeHtmlOptions();

// Owns a parsed document.
struct XmlDocFree {
  void operator()(xmlDoc* doc) const { xmlFreeDoc(doc); }
};

// Appends every text node under `node` in document order. Elements whose
// local name is in `blocks` (space-separated, or "*" for all) end a line; those in `skip`
// are left out with their content.
void CollectText(const xmlNode* node, const char* blocks, const char* skip, TextSink& text);

// The concatenated text of the first element with local name `name` (any
// namespace) under `node`; empty when there is none.
std::string FirstElementText(const xmlNode* node, const char* name);

// The local name of an element ("t" for "w:t").
std::string LocalName(const xmlNode* node);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
