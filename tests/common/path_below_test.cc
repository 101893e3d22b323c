#include "common/path_below.h"

#include <gtest/gtest.h>

namespace corvlumex {
namespace {

struct Case {
  const char* path;
  const char* folder;
  bool at_or_below;
  bool strictly_below;
};

TEST(PathBelowTest, TellsTheFolderItselfItsDescendantsAndItsLookalikesApart) {
  const Case cases[] = {
      {"/v/s/a", "/v/s/a", true, false},        // the folder itself
      {"/v/s/a/b", "/v/s/a", true, true},       // a child
      {"/v/s/a/b/c.txt", "/v/s/a", true, true}, // deeper
      {"/v/s/ab", "/v/s/a", false, false},      // a sibling whose name starts alike
      {"/v/s/a.txt", "/v/s/a", false, false},
      {"/v/s", "/v/s/a", false, false},         // the parent
      {"/v/s/b", "/v/s/a", false, false},
      {"/v/s/a/", "/v/s/a", true, true},        // a trailing "/" is something below
      {"/x", "/", true, true},                  // the root holds every absolute path
      {"/", "/", true, false},
      {"/v/s/a/b", "/v/s/a/", true, true},      // a folder given with its trailing "/"
      {"/v/s/a", "/v/s/a/", false, false},
      {"/V/S/A/b", "/v/s/a", false, false},     // bytes, not case-folded
      {"", "/v", false, false},
      {"relative/a", "/", false, false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(IsPathAtOrBelow(c.path, c.folder), c.at_or_below) << c.path << " in " << c.folder;
    EXPECT_EQ(IsPathStrictlyBelow(c.path, c.folder), c.strictly_below) << c.path << " in " << c.folder;
  }
}

TEST(PathBelowTest, ThePrefixOfWhatIsBelowEndsInOneSeparator) {
  const struct {
    const char* folder;
    const char* prefix;
  } cases[] = {{"/v/s/a", "/v/s/a/"}, {"/", "/"}, {"/v/s/a/", "/v/s/a/"}, {"", "/"}};
  for (const auto& c : cases) {
    EXPECT_EQ(PrefixOfPathsBelow(c.folder), c.prefix) << c.folder;
    EXPECT_TRUE(IsPathStrictlyBelow(std::string(c.prefix) + "x", c.folder)) << c.folder;
  }
}

}  // namespace
}  // namespace corvlumex
