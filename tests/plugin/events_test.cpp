#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"
#include "tests/plugin/plugin_loader.h"

namespace {

using plugin_test::LoadPlugin;

class EventsTest : public testing::Test {
 protected:
  void SetUp() override {
    handle_ = LoadPlugin().filter().Create();
    ASSERT_NE(handle_, nullptr);
  }
  void TearDown() override { LoadPlugin().filter().Destroy(handle_); }
  MmfFilterHandle* handle_ = nullptr;
};

void PostA(MmfFilterHandle*, uint32_t, const void*, uint32_t) {}
void PostB(MmfFilterHandle*, uint32_t, const void*, uint32_t) {}

TEST_F(EventsTest, IteratorZeroListsEvent4ThenTheListEnds) {
  const MmfEventProducerOps& ops = LoadPlugin().events();
  uint32_t event = 0;
  uint32_t iterator = 0;
  EXPECT_EQ(ops.EventList(handle_, &event, &iterator), 0);
  EXPECT_EQ(event, 4u);
  EXPECT_EQ(iterator, 1u);

  event = 99;
  EXPECT_EQ(ops.EventList(handle_, &event, &iterator), -1);
  EXPECT_EQ(event, 99u);
  EXPECT_EQ(iterator, 1u);

  iterator = 7;
  EXPECT_EQ(ops.EventList(handle_, &event, &iterator), -1);
  EXPECT_EQ(event, 99u);
}

TEST_F(EventsTest, PostFunctionIsStoredReplacedAndCleared) {
  const MmfEventProducerOps& ops = LoadPlugin().events();
  MkvContext* context = AsMkvFilter(handle_)->Context;
  ops.EventSetPostFunction(handle_, PostA);
  EXPECT_EQ(context->EventPost, &PostA);
  ops.EventSetPostFunction(handle_, PostB);
  EXPECT_EQ(context->EventPost, &PostB);
  ops.EventSetPostFunction(handle_, nullptr);
  EXPECT_EQ(context->EventPost, nullptr);
}

TEST_F(EventsTest, RegisterAndSetInputPositionAnswerZero) {
  EXPECT_EQ(LoadPlugin().events().EventRegister(handle_, 4, nullptr), 0);
  EXPECT_EQ(LoadPlugin().events().EventRegister(nullptr, 0, nullptr), 0);
  const auto& position = LoadPlugin().Get<MmfSetInputPositionOps>("MediaSetInputPosition");
  EXPECT_EQ(position.SetInputPosition(handle_, 12345), 0);
}

TEST_F(EventsTest, NullIteratorOrEventIsRefused) {
  uint32_t value = 0;
  EXPECT_EQ(LoadPlugin().events().EventList(handle_, nullptr, &value), 22);
  EXPECT_EQ(LoadPlugin().events().EventList(handle_, &value, nullptr), 22);
}

}  // namespace
