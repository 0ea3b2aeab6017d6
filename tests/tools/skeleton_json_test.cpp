#include "skeleton_json.h"

#include <stdexcept>

#include <gtest/gtest.h>

namespace tessik::bind {
namespace {

TEST(SkeletonJsonTest, OrdersParentsFirstAndReadsBothFrameForms) {
  const Skeleton s = parseSkeletonJson(R"([
    {"name": "hand", "parent": "arm", "position": [2, 0, 0], "tip": [2.5, 0, 0]},
    {"name": "arm", "parent": "root", "matrix": [0,-1,0,1, 1,0,0,0, 0,0,1,0, 0,0,0,1]},
    {"name": "root", "parent": null, "position": [0, 0, 0]},
    {"name": "tail", "position": [-1, 0, 0]}
  ])",
                                       "test");
  ASSERT_EQ(s.joints.size(), 4u);
  std::vector<std::string> names;
  for (const Joint& j : s.joints) names.push_back(j.name);
  EXPECT_EQ(names, (std::vector<std::string>{"root", "tail", "arm", "hand"}));
  EXPECT_EQ(s.joints[0].parent, -1);
  EXPECT_EQ(s.joints[1].parent, -1);
  EXPECT_EQ(s.joints[2].parent, 0);
  EXPECT_EQ(s.joints[3].parent, 2);
  EXPECT_EQ(s.joints[2].bindPose[1], -1.0);
  EXPECT_EQ(s.joints[2].bindPose[3], 1.0);
  EXPECT_EQ(translationOf(s.joints[3].bindPose), (Vec3f{2, 0, 0}));
  EXPECT_EQ(s.joints[3].bindPose[0], 1.0);
  EXPECT_EQ(s.joints[3].tip, (Vec3f{2.5f, 0, 0}));
  EXPECT_FALSE(s.joints[2].tip.has_value());
}

struct BadSkeleton {
  const char* text;
  const char* message;
};

class BadSkeletonTest : public ::testing::TestWithParam<BadSkeleton> {};

TEST_P(BadSkeletonTest, FailsWithOneClearLine) {
  try {
    parseSkeletonJson(GetParam().text, "bones.json");
    FAIL() << "accepted " << GetParam().text;
  } catch (const std::runtime_error& e) {
    const std::string what = e.what();
    EXPECT_NE(what.find("bones.json"), std::string::npos) << what;
    EXPECT_NE(what.find(GetParam().message), std::string::npos) << what;
    EXPECT_EQ(what.find('\n'), std::string::npos) << what;
  }
}

INSTANTIATE_TEST_SUITE_P(
    Faults,
    BadSkeletonTest,
    ::testing::Values(
        BadSkeleton{"[{\"name\": \"a\", \"position\": [0,0,0]", "not valid JSON"},
        BadSkeleton{"{\"name\": \"a\"}", "expected a list of bones"},
        BadSkeleton{"[]", "lists no bones"},
        BadSkeleton{"[{\"position\": [0,0,0]}]", "bone 0 has no name"},
        BadSkeleton{"[{\"name\": \"a\"}]", "neither matrix nor position"},
        BadSkeleton{"[{\"name\": \"a\", \"matrix\": [1,0,0]}]", "matrix needs 16 numbers"},
        BadSkeleton{"[{\"name\": \"a\", \"position\": [0,\"x\",0]}]", "position needs 3 finite numbers"},
        BadSkeleton{"[{\"name\": \"a\", \"position\": [0,0,0], \"tip\": [1,0]}]", "tip needs 3 numbers"},
        BadSkeleton{"[{\"name\": \"a\", \"parent\": \"b\", \"position\": [0,0,0]}]",
                    "bone 'a' names unknown parent 'b'"},
        BadSkeleton{"[{\"name\": \"a\", \"position\": [0,0,0]}, {\"name\": \"a\", \"position\": [1,0,0]}]",
                    "bone 'a' appears twice"},
        BadSkeleton{"[{\"name\": \"r\", \"position\": [0,0,0]},"
                    " {\"name\": \"a\", \"parent\": \"b\", \"position\": [0,0,0]},"
                    " {\"name\": \"b\", \"parent\": \"a\", \"position\": [1,0,0]}]",
                    "form a loop"}));

TEST(SkeletonJsonTest, MissingFileNamesIt) {
  EXPECT_THROW(
      {
        try {
          readSkeletonJson("/nonexistent/bones.json");
        } catch (const std::runtime_error& e) {
          EXPECT_NE(std::string(e.what()).find("/nonexistent/bones.json"), std::string::npos);
          throw;
        }
      },
      std::runtime_error);
}

}  // namespace
}  // namespace tessik::bind
