// The one query syntax for people: what someone types into the command line
// or the web app's search box, turned into the search daemon's clause tree.
// Both front ends call this, so a query means the same everywhere; the
// syntax, with examples, is in docs/search.md.
//
//   saffron rice            every word, in the name, the content or any text field
//   "copyright holder"      the words next to each other, in this order
//   budg*                   a word that starts with "budg"
//   tea OR coffee           either (OR binds tighter than the blank between words)
//   -draft  NOT draft       without the word
//   (tea OR coffee) cake    parentheses group
//   name:rep  ext:pdf  type:photo  in:/volume1/docs  path:/volume1/docs
//   size:>10M  modified:>2026-01-01  modified:<7d  owner:alice
//
// Words are not analysed here: the daemon applies its own word rules to the
// text of each clause, so the parser never disagrees with the index about
// what a word is.
#pragma once

#include <json/json.h>
#include <time.h>

#include <stdexcept>
#include <string>

namespace corvlumex {
namespace fileindex {

// Thrown on a query that cannot be parsed; what() says where and why.
class UserQuerySyntaxError : public std::runtime_error {
 public:
  UserQuerySyntaxError(size_t position, const std::string& reason);
  // Byte offset in the query text where the fault was found (0 = the start).
  size_t position() const { return position_; }
  // The fault alone, without the position ("unclosed quote").
  const std::string& reason() const { return reason_; }

 private:
  size_t position_;
  std::string reason_;
};

// Parses what a person typed into the search daemon's "query" clause: the
// value of a "search" request's "query" member, {"qsl": clause}. A blank
// text gives match_all. Relative dates (modified:<7d) count from now.
Json::Value UserQueryToSearch(const std::string& text);

// The same, with relative dates counted from `now` (seconds since 1970).
Json::Value UserQueryToSearch(const std::string& text, time_t now);

}  // namespace fileindex
}  // namespace corvlumex
