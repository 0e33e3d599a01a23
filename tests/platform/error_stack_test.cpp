#include "platform/core/error_stack.h"

#include <errno.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <thread>

#include "platform/include/mavocore.h"
#include "tests/platform/support/allocation_control.h"

namespace mavoea::core {
namespace {

// A new thread has a new stack, so every test runs in one of its own.
template <class Body>
void InNewThread(Body body) {
    std::thread(body).join();
}

TEST(ErrorStackTest, AnEmptyStackHasNoCodeNoFileAndNoLine) {
    InNewThread([] {
        EXPECT_EQ(0u, ErrorStackDepth());
        EXPECT_EQ(0, MLIBCErrGet());
        EXPECT_STREQ("", MLIBCErrorGetFile());
        EXPECT_EQ(0, MLIBCErrorGetLine());
    });
}

TEST(ErrorStackTest, TheLastRecordIsOnTop) {
    InNewThread([] {
        MLIBCErrSetEx(0xD00, "ea_mkdir.c", 51);
        MLIBCErrSetEx(0x2800, "eas_open", 165);
        EXPECT_EQ(0x2800, MLIBCErrGet());
        EXPECT_STREQ("eas_open", MLIBCErrorGetFile());
        EXPECT_EQ(165, MLIBCErrorGetLine());
        ASSERT_EQ(2u, ErrorStackDepth());
        EXPECT_EQ(0xD00, ErrorStackAt(1).code);
        EXPECT_STREQ("ea_mkdir.c", ErrorStackAt(1).file);
        EXPECT_EQ(51, ErrorStackAt(1).line);
    });
}

TEST(ErrorStackTest, AFullStackLosesItsOldestRecord) {
    InNewThread([] {
        for (int code = 1; code <= 64; ++code) MLIBCErrSetEx(code, "f", code);
        EXPECT_EQ(64u, ErrorStackDepth());
        EXPECT_EQ(1, ErrorStackAt(63).code);

        MLIBCErrSetEx(65, "f", 65);
        EXPECT_EQ(64u, ErrorStackDepth());
        EXPECT_EQ(65, MLIBCErrGet());
        for (int depth = 0; depth < 64; ++depth) {
            EXPECT_EQ(65 - depth, ErrorStackAt(static_cast<std::size_t>(depth)).code);
        }
        EXPECT_EQ(0, ErrorStackAt(64).code);
    });
}

// Promise: "THREADS: The error stack is each thread's own"
TEST(ErrorStackTest, EachThreadHasItsOwnStack) {
    InNewThread([] {
        MLIBCErrSetEx(1, "outer", 10);
        InNewThread([] {
            EXPECT_EQ(0, MLIBCErrGet());
            MLIBCErrSetEx(2, "inner", 20);
            EXPECT_EQ(2, MLIBCErrGet());
        });
        EXPECT_EQ(1, MLIBCErrGet());
        EXPECT_STREQ("outer", MLIBCErrorGetFile());
        EXPECT_EQ(1u, ErrorStackDepth());
    });
}

TEST(ErrorStackTest, NothingIsAllocatedAndErrnoStays) {
    InNewThread([] {
        errno = ERANGE;
        const auto before = test::AllocationCount();
        for (int i = 0; i < 200; ++i) MLIBCErrSetEx(i, "f", i);
        MLIBCErrGet();
        MLIBCErrorGetFile();
        MLIBCErrorGetLine();
        EXPECT_EQ(before, test::AllocationCount());
        EXPECT_EQ(ERANGE, errno);
    });
}

TEST(ErrorStackTest, AFileThatIsNullReadsAsEmpty) {
    InNewThread([] {
        MLIBCErrSetEx(1, nullptr, 2);
        EXPECT_STREQ("", MLIBCErrorGetFile());
    });
}

}  // namespace
}  // namespace mavoea::core
