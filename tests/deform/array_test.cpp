#include <cstdint>
#include <cstdlib>
#include <cwchar>
#include <vector>

#include <gtest/gtest.h>

#include <tessik/array.h>
#include <tessik/util.h>

namespace {

using TessikSDK::Array;

struct Record {
  std::int32_t id;
  float value;
};

// Counts allocations and fails on request, so the out-of-memory path can be forced.
struct ScriptedAllocator {
  static inline int allocations = 0;
  static inline int live = 0;
  static inline bool failNext = false;
  static void* Allocate(std::size_t bytes) noexcept {
    if (failNext) {
      failNext = false;
      return nullptr;
    }
    ++allocations;
    ++live;
    return std::malloc(bytes);
  }
  static void Deallocate(void* memory) noexcept {
    if (memory != nullptr) --live;
    std::free(memory);
  }
};

class ArrayTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ScriptedAllocator::allocations = 0;
    ScriptedAllocator::live = 0;
    ScriptedAllocator::failNext = false;
  }
  void TearDown() override { EXPECT_EQ(ScriptedAllocator::live, 0) << "storage leaked"; }
  using Records = Array<Record, ScriptedAllocator>;
};

struct GrowthCase {
  std::vector<std::uint64_t> lengths;  // successive SetLength calls from empty
  std::uint64_t reserved;              // reserved length after the last call
};

class ArrayGrowth : public ArrayTest, public ::testing::WithParamInterface<GrowthCase> {};

TEST_P(ArrayGrowth, ReservesByGrowLengthOrHalf) {
  Records array;
  for (std::uint64_t length : GetParam().lengths) array.SetLength(length, Record{0, 0});
  EXPECT_EQ(array.ReservedLength(), GetParam().reserved);
  EXPECT_EQ(array.UsedLength(), GetParam().lengths.back());
  EXPECT_EQ(array.GrowLength(), 8u);
}

INSTANTIATE_TEST_SUITE_P(Array,
                         ArrayGrowth,
                         ::testing::Values(GrowthCase{{1}, 9},
                                           GrowthCase{{1, 10}, 18},
                                           GrowthCase{{1, 10, 40}, 60},
                                           GrowthCase{{8}, 16},
                                           GrowthCase{{8, 17}, 25},
                                           GrowthCase{{8, 16}, 16},
                                           GrowthCase{{40, 2, 50}, 60}));

TEST_F(ArrayTest, GrowingKeepsRecordsAndFillsTheRest) {
  Records array;
  array.SetLength(3, Record{-1, 0});
  for (int i = 0; i < 3; ++i) array[i] = Record{i, i * 0.5f};
  array.SetLength(30, Record{7, 7.0f});  // moves storage
  EXPECT_EQ(ScriptedAllocator::allocations, 2);
  for (int i = 0; i < 3; ++i) EXPECT_EQ(array[i].id, i);
  for (int i = 3; i < 30; ++i) EXPECT_EQ(array[i].id, 7);
}

TEST_F(ArrayTest, ShrinkKeepsStorageAndRegrowGivesFreshRecords) {
  Records array;
  array.SetLength(5, Record{0, 0});
  for (int i = 0; i < 5; ++i) array[i].id = 100 + i;
  array.SetLength(2, Record{0, 0});
  EXPECT_EQ(array.ReservedLength(), 13u);
  EXPECT_THROW(array[2], TessikSDK::Util::OutOfRangeException);
  array.SetLength(5, Record{-5, 0});
  EXPECT_EQ(ScriptedAllocator::allocations, 1);
  EXPECT_EQ(array[0].id, 100);
  EXPECT_EQ(array[1].id, 101);
  for (int i = 2; i < 5; ++i) EXPECT_EQ(array[i].id, -5);
}

TEST_F(ArrayTest, FailedGrowthThrowsAndKeepsOldStorage) {
  Records array;
  array.SetLength(4, Record{3, 3.0f});
  const Record* before = &array[0];
  ScriptedAllocator::failNext = true;
  EXPECT_THROW(array.SetLength(100, Record{0, 0}), TessikSDK::Util::OutOfMemoryException);
  EXPECT_EQ(array.ReservedLength(), 12u);
  EXPECT_EQ(array.UsedLength(), 4u);
  EXPECT_EQ(&array[0], before);
  for (int i = 0; i < 4; ++i) EXPECT_EQ(array[i].id, 3);
}

TEST_F(ArrayTest, IndexOutsideUsedLengthThrowsWithTheMessage) {
  Records array;
  array.SetLength(3, Record{0, 0});
  for (int bad : {-1, 3, 4, -2147483647 - 1}) {
    try {
      array[bad];
      ADD_FAILURE() << "index " << bad << " accepted";
    } catch (const TessikSDK::Util::OutOfRangeException& e) {
      EXPECT_STREQ(e.Message(), L"Argument index out of bounds, passed into a TessikSDK::Array::operator[]");
      EXPECT_STREQ(e.what(), "Argument index out of bounds, passed into a TessikSDK::Array::operator[]");
    }
  }
}

}  // namespace
