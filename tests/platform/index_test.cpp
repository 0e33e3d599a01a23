// Index notifications and the process's observer.

#include <errno.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/include/mavocore.h"

namespace {

using ::testing::ElementsAre;

struct Seen {
    std::vector<std::string> events;
    int answer = 0;
};

std::string Text(const char* text) { return text == nullptr ? "NULL" : text; }

int Observe(void* context, int which, const char* path, const char* old_path, int op) {
    auto* const seen = static_cast<Seen*>(context);
    seen->events.push_back((which == MAVO_INDEX_FILE ? "file " : "search ") + Text(path) + " " +
                           Text(old_path) + " " + std::to_string(op));
    return seen->answer;
}

class IndexTest : public ::testing::Test {
 protected:
    ~IndexTest() override { MAVOIndexObserverSet(nullptr, nullptr); }
};

TEST_F(IndexTest, WithoutAnObserverBothReturn0) {
    errno = ERANGE;
    EXPECT_EQ(0, MLIBMavoFileIndexAdd("/v/a", nullptr, 6));
    EXPECT_EQ(0, MLIBMavoIndexAddEx("/v/a", nullptr, 7, 0, 0));
    EXPECT_EQ(ERANGE, errno);
}

TEST_F(IndexTest, TheObserverSeesWhatIsNotifiedAndItsAnswerIsReturned) {
    Seen seen;
    MAVOIndexObserverSet(Observe, &seen);
    EXPECT_EQ(0, MLIBMavoFileIndexAdd("/v/a", nullptr, 6));
    seen.answer = -3;
    EXPECT_EQ(-3, MLIBMavoIndexAddEx("/v/b", "/v/a", 4, 0, 0));
    EXPECT_THAT(seen.events, ElementsAre("file /v/a NULL 6", "search /v/b /v/a 4"));
}

TEST_F(IndexTest, AnotherObserverReplacesTheFirstAndNullEndsIt) {
    Seen first, second;
    MAVOIndexObserverSet(Observe, &first);
    MAVOIndexObserverSet(Observe, &second);
    MLIBMavoFileIndexAdd("/v/a", nullptr, 1);
    MAVOIndexObserverSet(nullptr, nullptr);
    MLIBMavoFileIndexAdd("/v/a", nullptr, 2);
    EXPECT_TRUE(first.events.empty());
    EXPECT_THAT(second.events, ElementsAre("file /v/a NULL 1"));
}

TEST_F(IndexTest, AnObserverMayRegisterAnother) {
    MAVOIndexObserverSet(
        [](void*, int, const char*, const char*, int) {
            MAVOIndexObserverSet(nullptr, nullptr);
            return 5;
        },
        nullptr);
    EXPECT_EQ(5, MLIBMavoFileIndexAdd("/v/a", nullptr, 1));
    EXPECT_EQ(0, MLIBMavoFileIndexAdd("/v/a", nullptr, 1));
}

}  // namespace
