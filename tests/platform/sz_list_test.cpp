// The string list: growth, failures, ownership.

#include <errno.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <climits>
#include <memory>
#include <string>
#include <vector>

#include "platform/include/mavocore.h"
#include "tests/platform/support/allocation_control.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

struct FreeList {
    void operator()(MLIBCSzList* list) const { MLIBCSzListFree(list); }
};
using List = std::unique_ptr<MLIBCSzList, FreeList>;

// Pushes as callers do, who hold the list by pointer.
int Push(List* list, const char* text) {
    MLIBCSzList* raw = list->release();
    const int result = MLIBCSzListPush(&raw, text);
    list->reset(raw);
    return result;
}

std::vector<std::string> Strings(const List& list) {
    std::vector<std::string> strings;
    for (int i = 0; MLIBCSzListGet(list.get(), i) != nullptr; ++i) {
        strings.emplace_back(MLIBCSzListGet(list.get(), i));
    }
    return strings;
}

TEST(SzListTest, ANewListIsEmpty) {
    const List list(MLIBCSzListAlloc(4));
    ASSERT_NE(nullptr, list);
    EXPECT_THAT(Strings(list), IsEmpty());
}

TEST(SzListTest, StringsStayInTheOrderPushed) {
    List list(MLIBCSzListAlloc(2));
    EXPECT_EQ(0, Push(&list, "b"));
    EXPECT_EQ(0, Push(&list, ""));
    EXPECT_EQ(0, Push(&list, "a"));
    EXPECT_THAT(Strings(list), ElementsAre("b", "", "a"));
}

TEST(SzListTest, TheListOwnsCopies) {
    List list(MLIBCSzListAlloc(1));
    char text[] = "name";
    ASSERT_EQ(0, Push(&list, text));
    text[0] = 'X';
    EXPECT_STREQ("name", MLIBCSzListGet(list.get(), 0));
}

TEST(SzListTest, PastTheEndAndBelowZeroThereIsNothing) {
    List list(MLIBCSzListAlloc(8));
    ASSERT_EQ(0, Push(&list, "a"));
    EXPECT_EQ(nullptr, MLIBCSzListGet(list.get(), 1));
    EXPECT_EQ(nullptr, MLIBCSzListGet(list.get(), 7));
    EXPECT_EQ(nullptr, MLIBCSzListGet(list.get(), INT_MAX));
    EXPECT_EQ(nullptr, MLIBCSzListGet(list.get(), -1));
    EXPECT_EQ(nullptr, MLIBCSzListGet(list.get(), INT_MIN));
    EXPECT_EQ(nullptr, MLIBCSzListGet(nullptr, 0));
}

TEST(SzListTest, EveryStartingCapacityGrowsAndStringsStayWhereTheyAre) {
    for (int capacity : {0, 1, 7, 8, 9, 100, 1024}) {
        SCOPED_TRACE(capacity);
        List list(MLIBCSzListAlloc(capacity));
        ASSERT_NE(nullptr, list);
        ASSERT_EQ(0, Push(&list, "first"));
        const char* const first = MLIBCSzListGet(list.get(), 0);
        for (int i = 1; i < 3000; ++i) ASSERT_EQ(0, Push(&list, std::to_string(i).c_str()));
        EXPECT_EQ(first, MLIBCSzListGet(list.get(), 0));
        for (int i = 1; i < 3000; ++i) {
            ASSERT_EQ(std::to_string(i), MLIBCSzListGet(list.get(), i));
        }
        EXPECT_EQ(nullptr, MLIBCSzListGet(list.get(), 3000));
    }
}

TEST(SzListTest, AnEmptiedListCanBeFilledAgain) {
    List list(MLIBCSzListAlloc(1));
    ASSERT_EQ(0, Push(&list, "a"));
    ASSERT_EQ(0, Push(&list, "b"));
    MLIBCSzListRemoveAll(list.get());
    EXPECT_THAT(Strings(list), IsEmpty());
    EXPECT_EQ(0, Push(&list, "c"));
    EXPECT_THAT(Strings(list), ElementsAre("c"));
}

TEST(SzListTest, NullArgumentsAreRefused) {
    List list(MLIBCSzListAlloc(1));
    errno = 0;
    EXPECT_GT(0, MLIBCSzListPush(nullptr, "a"));
    EXPECT_EQ(EINVAL, errno);
    MLIBCSzList* none = nullptr;
    errno = 0;
    EXPECT_GT(0, MLIBCSzListPush(&none, "a"));
    EXPECT_EQ(EINVAL, errno);
    errno = 0;
    EXPECT_GT(0, Push(&list, nullptr));
    EXPECT_EQ(EINVAL, errno);
    EXPECT_THAT(Strings(list), IsEmpty());
    MLIBCSzListRemoveAll(nullptr);
    MLIBCSzListFree(nullptr);
}

TEST(SzListTest, ACapacityBelowZeroIsRefused) {
    errno = 0;
    EXPECT_EQ(nullptr, MLIBCSzListAlloc(-1));
    EXPECT_EQ(EINVAL, errno);
}

TEST(SzListTest, AllocReportsEveryAllocationThatFails) {
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        MLIBCSzList* raw;
        {
            FailNthAllocation fault(nth);
            errno = 0;
            raw = MLIBCSzListAlloc(4);
            if (fault.fired()) {
                EXPECT_EQ(nullptr, raw);
                EXPECT_EQ(ENOMEM, errno);
                continue;
            }
        }
        const List list(raw);
        EXPECT_NE(nullptr, list);
        EXPECT_EQ(3, nth) << "the list and its room";
        break;
    }
}

TEST(SzListTest, PushThatRunsOutOfMemoryLeavesTheListAsItWas) {
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        List list(MLIBCSzListAlloc(1));
        ASSERT_EQ(0, Push(&list, "a"));
        bool fired;
        int result;
        {
            FailNthAllocation fault(nth);
            errno = 0;
            result = Push(&list, "b");
            fired = fault.fired();
        }
        if (!fired) {
            EXPECT_EQ(0, result);
            EXPECT_EQ(3, nth) << "the room and the copy";
            break;
        }
        EXPECT_GT(0, result);
        EXPECT_EQ(ENOMEM, errno);
        EXPECT_THAT(Strings(list), ElementsAre("a"));
        EXPECT_EQ(0, Push(&list, "c"));
        EXPECT_THAT(Strings(list), ElementsAre("a", "c"));
    }
}

TEST(SzListTest, EmptyingAndFreeingLeaveErrnoAlone) {
    List list(MLIBCSzListAlloc(1));
    ASSERT_EQ(0, Push(&list, std::string(1 << 20, 'x').c_str()));
    errno = ERANGE;
    MLIBCSzListRemoveAll(list.get());
    list.reset();
    EXPECT_EQ(ERANGE, errno);
}

}  // namespace
}  // namespace mavoea::test
