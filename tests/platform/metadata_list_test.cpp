// The reference host's metadata list: order, copies and ownership.

#include <gtest/gtest.h>

#include <cstring>

#include "pivlo/pivlo.h"
#include "support/test_host.h"

namespace {

using zantest::TestAllocator;

MetadataList* NewList() { return pivloCreateMetadataList(TestAllocator::Alloc, TestAllocator::Free); }

// The list holds copies in order of arrival; without memory it is not
// created, and without allocators it uses the C heap.
TEST(MetadataList, KeepsCopiesInOrderOfArrival) {
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(NewList(), nullptr);
    TestAllocator::Reset();
    MetadataList* list = NewList();
    ASSERT_NE(list, nullptr);
    MetadataEntry entry{};
    entry.group = ZAN_METADATA_IMAGE;
    entry.type = ZAN_METADATA_U32;
    for (uint32_t tag : {305u, 270u, 282u}) {
        entry.tag = tag;
        entry.value.u32 = tag * 2;
        ASSERT_EQ(zanAddToMetadataList(nullptr, list, &entry), 1);
    }
    entry.tag = 999;  // the caller reuses its record; the list has copies
    std::vector<uint32_t> tags;
    for (const MetadataEntry* e = pivloMetadataListFirst(list); e; e = e->next) {
        tags.push_back(e->tag);
        EXPECT_EQ(e->value.u32, e->tag * 2);
    }
    EXPECT_EQ(tags, (std::vector<uint32_t>{305, 270, 282}));
    EXPECT_EQ(pivloMetadataListLength(list), 3u);
    pivloDestroyMetadataList(list);
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    MetadataList* heapList = pivloCreateMetadataList(nullptr, nullptr);
    ASSERT_NE(heapList, nullptr);
    pivloDestroyMetadataList(heapList);
}

// A refused entry (no memory for its copy, no list, no entry) leaves the
// block with the caller; once accepted, the block goes with the list.
TEST(MetadataList, BlockBelongsToTheListOnceItsEntryIsAccepted) {
    MetadataList* list = NewList();
    MetadataEntry entry{};
    entry.group = ZAN_METADATA_ICC;
    entry.tag = 34675;
    entry.type = ZAN_METADATA_BLOCK;
    entry.size = 5;
    entry.value.block = list->allocProc(5);
    std::memcpy(entry.value.block, "icc!", 5);
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(zanAddToMetadataList(nullptr, list, &entry), 0);
    EXPECT_EQ(pivloMetadataListLength(list), 0u);
    EXPECT_EQ(zanAddToMetadataList(nullptr, nullptr, &entry), 0);
    EXPECT_EQ(zanAddToMetadataList(nullptr, list, nullptr), 0);
    EXPECT_TRUE(TestAllocator::Owns(entry.value.block)) << "still the caller's";
    ASSERT_EQ(zanAddToMetadataList(nullptr, list, &entry), 1);
    EXPECT_STREQ(static_cast<const char*>(pivloMetadataListFirst(list)->value.block), "icc!");
    pivloDestroyMetadataList(list);
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << "the block went with the list";
}

}  // namespace
