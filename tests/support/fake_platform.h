// The platform libraries as tests need them: every call recorded, answers to order. Defines the
// MLIBC... and MAVO... symbols and syslog, so a test program that links it sees these and not the
// platform's.
#ifndef MAVOEA_TESTS_SUPPORT_FAKE_PLATFORM_H_
#define MAVOEA_TESTS_SUPPORT_FAKE_PLATFORM_H_

#include <gmock/gmock.h>

#include <functional>
#include <ostream>
#include <string>
#include <vector>

#include "platform/include/mavoacl.h"
#include "platform/include/mavocore.h"

namespace mavoea::test {

// One record of the error stack.
struct Record {
    int code = 0;
    std::string unit;
    int line = 0;
};
void PrintTo(const Record& record, std::ostream* out);

// The records pushed since the last time, oldest first.
std::vector<Record> TakeRecords();

// Matches a record of this code and unit with any line above 0, as in
// EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_read"))).
::testing::Matcher<const Record&> RecordOf(int code, const std::string& unit);

// The lines logged since the last time (priority 3 only), as syslog would write them but without a
// trailing newline, and with every line number as "LINE": "ea_mkdir.c:LINE Invaild Argument ...".
std::vector<std::string> TakeLog();

// Their line numbers, since the last time that these were taken; 0 where there is none.
std::vector<int> TakeLogLines();

// Expects no record and no line since the last time.
void ExpectNothingReported();

// The calls made to the platform since the last time, other than error stack and string lists:
// "MAVOGetFSType(/v, 1)", "MAVOACLSetEADirACL(/v/@eaDir)", "MLIBMavoIndexAddEx(/v/a, NULL, 7, 0,
// 0)", "MLIBMavoFileIndexAdd(/v/a, NULL, 6)", "MLIBCExec(/bin/cp, -f, /a, /b)",
// "MLIBCFileStat(/v/a, 3)", "MAVOStrReplaceFATReservedChar(/v/a)".
std::vector<std::string> TakePlatformCalls();

// Answers. Without one: type 1, ACL 0, index 0, exec runs the program, FileStat gives the mode and
// an attribute word of 0, and the FAT replacement copies.
struct FakePlatform {
    std::function<int(const std::string& path, int flag)> fs_type;
    std::function<int(const std::string& path)> acl;
    std::function<int(const std::string& call)> index;
    std::function<int(const std::vector<std::string>& argv)> exec;
    std::function<int(const std::string& path, unsigned char info[128])> file_stat;
    std::function<std::string(const std::string& path)> fat_replace;
    int pushes_until_failure = -1;  // below 0: list pushes never fail

    // Asked by every call that can fail, those of string lists included ("MLIBCSzListPush(a)",
    // "MLIBCSzListAlloc()"), before it does anything: what it answers instead, below 0 where it
    // answers with a pointer or a count; 0 when it is to go on.
    std::function<int(const std::string& call)> fails;
};
FakePlatform& Platform();

// Clears answers, records, log and calls.
void ResetPlatform();

// What a string list holds; and a list that holds `strings`, to be freed with MLIBCSzListFree().
std::vector<std::string> Strings(const MLIBCSzList* list);
MLIBCSzList* NewList(const std::vector<std::string>& strings = {});

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_FAKE_PLATFORM_H_
