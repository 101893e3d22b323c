#include "platform/linux/extract/parsers/xml_text.h"

#include <libxml/HTMLparser.h>
#include <libxml/parser.h>

#include <cstring>
#include <vector>

#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

bool InList(const std::string& name, const char* list) {
  if (list == nullptr || name.empty()) return false;
  if (strcmp(list, "*") == 0) return true;
  const char* p = list;
  const size_t length = name.size();
  while ((p = strstr(p, name.c_str())) != nullptr) {
    const bool starts = p == list || p[-1] == ' ';
    const bool ends = p[length] == '\0' || p[length] == ' ';
    if (starts && ends) return true;
    p += length;
  }
  return false;
}

}  // namespace

int SafeXmlOptions() { return XML_PARSE_NONET | XML_PARSE_NOERROR | XML_PARSE_NOWARNING | XML_PARSE_RECOVER; }

int SafeHtmlOptions() {
  return HTML_PARSE_NONET | HTML_PARSE_NOERROR | HTML_PARSE_NOWARNING | HTML_PARSE_RECOVER;
}

std::string LocalName(const xmlNode* node) {
  return node->name != nullptr ? reinterpret_cast<const char*>(node->name) : std::string();
}

void CollectText(const xmlNode* root, const char* blocks, const char* skip, TextSink& text) {
  // An explicit stack: a deeply nested hostile document must not exhaust
  // the worker's stack.
  struct Frame {
    const xmlNode* node;
    bool leaving;
  };
  std::vector<Frame> stack;
  stack.push_back({root, false});
  while (!stack.empty() && !text.full()) {
    const Frame frame = stack.back();
    stack.pop_back();
    const xmlNode* node = frame.node;
    if (frame.leaving) {
      text.Break();
      continue;
    }
    if (node->type == XML_TEXT_NODE || node->type == XML_CDATA_SECTION_NODE) {
      if (node->content != nullptr) text.Append(reinterpret_cast<const char*>(node->content));
      continue;
    }
    if (node->type != XML_ELEMENT_NODE && node->type != XML_DOCUMENT_NODE &&
        node->type != XML_HTML_DOCUMENT_NODE) {
      continue;
    }
    const std::string name = LocalName(node);
    if (node->type == XML_ELEMENT_NODE && InList(name, skip)) continue;
    const bool block = node->type == XML_ELEMENT_NODE && InList(name, blocks);
    if (block) stack.push_back({node, true});
    // Children pushed last-first so they come out in document order.
    std::vector<const xmlNode*> children;
    for (const xmlNode* child = node->children; child != nullptr; child = child->next) children.push_back(child);
    for (auto it = children.rbegin(); it != children.rend(); ++it) stack.push_back({*it, false});
    if (block) text.Break();
  }
}

std::string FirstElementText(const xmlNode* root, const char* name) {
  std::vector<const xmlNode*> stack = {root};
  while (!stack.empty()) {
    const xmlNode* node = stack.back();
    stack.pop_back();
    if (node->type == XML_ELEMENT_NODE && LocalName(node) == name) {
      TextSink sink(64 * 1024);
      CollectText(node, nullptr, nullptr, sink);
      return sink.text();
    }
    std::vector<const xmlNode*> children;
    for (const xmlNode* child = node->children; child != nullptr; child = child->next) children.push_back(child);
    for (auto it = children.rbegin(); it != children.rend(); ++it) stack.push_back(*it);
  }
  return std::string();
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
