#include "base/vector.h"

#include <gtest/gtest.h>

#include <chrono>
#include <numeric>
#include <thread>
#include <vector>

namespace tessel {
namespace {

std::int8_t CompareData(const VectorNode* a, const VectorNode* b) {
  return a->data < b->data ? -1 : (a->data > b->data ? 1 : 0);
}

class VectorTest : public ::testing::Test {
 protected:
  void SetUp() override {
    InitVector(&ordered_, &kOrdered);
    InitVector(&plain_, nullptr);
  }
  void TearDown() override {
    FreeVector(&ordered_);
    FreeVector(&plain_);
  }

  static std::vector<std::uint64_t> Contents(Vector* vector) {
    std::vector<std::uint64_t> out;
    for (VectorNode* node = GetElementAt(vector, 0); node; node = node->next)
      out.push_back(node->data);
    return out;
  }

  static constexpr VectorProperties kOrdered{CompareData};
  Vector ordered_;
  Vector plain_;
};

TEST_F(VectorTest, OrderedInsertionSortsAndRefusesDuplicates) {
  int refused = 0;
  for (std::uint64_t i = 0; i < 200; ++i) {  // 0 to 100 in scattered order, then 99 repeats
    VectorNode* node = NewVectorNode((i * 37) % 101);
    if (!AddElement(&ordered_, node)) ++refused, delete node;
  }
  std::vector<std::uint64_t> expected(101);
  std::iota(expected.begin(), expected.end(), 0);
  EXPECT_EQ(Contents(&ordered_), expected);
  EXPECT_EQ(refused, 99);
  EXPECT_EQ(ordered_.count, 101);
  EXPECT_EQ(ordered_.tail->data, 100u);
}

TEST_F(VectorTest, PositionalOperationsRespectBounds) {
  for (std::uint64_t v : {10, 20, 30}) AddElement(&plain_, NewVectorNode(v));
  VectorNode* appended = NewVectorNode(40);
  EXPECT_TRUE(InsertElementAt(&plain_, appended, 3));
  EXPECT_EQ(plain_.tail, appended);
  VectorNode* rejected = NewVectorNode(50);
  EXPECT_FALSE(InsertElementAt(&plain_, rejected, 5));
  delete rejected;
  EXPECT_TRUE(InsertElementAt(&plain_, NewVectorNode(5), 0));
  EXPECT_EQ(Contents(&plain_), (std::vector<std::uint64_t>{5, 10, 20, 30, 40}));
  EXPECT_EQ(GetElementAt(&plain_, -1), nullptr);
  EXPECT_EQ(GetElementAt(&plain_, plain_.count), nullptr);
  EXPECT_FALSE(DeleteElementAt(&plain_, 5));
  EXPECT_TRUE(DeleteElementAt(&plain_, 4));
  EXPECT_EQ(plain_.tail->data, 30u);
  EXPECT_EQ(GetNthElement(&plain_, 2, plain_.head)->data, 20u);
  EXPECT_EQ(GetNthElement(&plain_, 9, plain_.head), nullptr);
}

TEST_F(VectorTest, ConcurrentProducersAndConsumerLoseNothing) {
  constexpr std::uint64_t kItems = 8000;  // 1 to 8000, from four producers
  std::vector<std::thread> producers;
  for (std::uint64_t t = 0; t < 4; ++t) {
    producers.emplace_back([this, t] {
      for (std::uint64_t i = 1; i <= kItems / 4; ++i)
        AddElement(&plain_, NewVectorNode(t * kItems / 4 + i));
    });
  }
  std::uint64_t sum = 0, payload = 0;
  auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  for (std::uint64_t taken = 0; taken < kItems && std::chrono::steady_clock::now() < deadline;)
    if (TakeFirstElement(&plain_, &payload)) sum += payload, ++taken;
  for (auto& producer : producers) producer.join();
  EXPECT_EQ(sum, kItems * (kItems + 1) / 2);
  EXPECT_EQ(plain_.count, 0);
}

}  // namespace
}  // namespace tessel
