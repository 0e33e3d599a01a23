#include "tests/support/fake_platform.h"

#include <errno.h>
#include <spawn.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdint>
#include <utility>

struct MLIBCSzList {
    std::vector<std::string> strings;
};

namespace mavoea::test {
namespace {

struct State {
    FakePlatform answers;
    std::vector<Record> records;  // since the last Take
    Record top;
    std::vector<std::string> log;
    std::vector<int> log_lines;
    std::vector<std::string> calls;
};

State& TheState() {
    static State& state = *new State;
    return state;
}

std::string Text(const char* text) { return text == nullptr ? "NULL" : text; }

// What the call is to answer without doing anything; 0 when it goes on.
int Refusal(const std::string& call) {
    const auto& fails = TheState().answers.fails;
    return fails ? fails(call) : 0;
}

// The same of a call that is noted.
int NoteCall(const std::string& call) {
    TheState().calls.push_back(call);
    return Refusal(call);
}

// The digits behind the first ':', which the library's formats begin with.
int LineOf(const std::string& text) {
    const auto colon = text.find(':');
    return colon == std::string::npos ? 0 : atoi(text.c_str() + colon + 1);
}

// Puts "LINE" for those digits.
std::string WithoutLine(std::string text) {
    const auto colon = text.find(':');
    if (colon == std::string::npos) return text;
    auto end = colon + 1;
    while (end < text.size() && text[end] >= '0' && text[end] <= '9') ++end;
    if (end > colon + 1) text.replace(colon + 1, end - colon - 1, "LINE");
    return text;
}

}  // namespace

void PrintTo(const Record& record, std::ostream* out) {
    *out << "{0x" << std::hex << std::uppercase << record.code << std::dec << ", " << record.unit
         << ":" << record.line << "}";
}

std::vector<Record> TakeRecords() { return std::exchange(TheState().records, {}); }

::testing::Matcher<const Record&> RecordOf(int code, const std::string& unit) {
    using ::testing::AllOf;
    using ::testing::Field;
    using ::testing::Gt;
    return AllOf(Field("code", &Record::code, code), Field("unit", &Record::unit, unit),
                 Field("line", &Record::line, Gt(0)));
}

std::vector<std::string> TakeLog() { return std::exchange(TheState().log, {}); }
std::vector<int> TakeLogLines() { return std::exchange(TheState().log_lines, {}); }
void ExpectNothingReported() {
    EXPECT_THAT(TakeRecords(), ::testing::IsEmpty());
    EXPECT_THAT(TakeLog(), ::testing::IsEmpty());
}
std::vector<std::string> TakePlatformCalls() { return std::exchange(TheState().calls, {}); }
FakePlatform& Platform() { return TheState().answers; }
void ResetPlatform() { TheState() = State{}; }
std::vector<std::string> Strings(const MLIBCSzList* list) { return list->strings; }
MLIBCSzList* NewList(const std::vector<std::string>& strings) { return new MLIBCSzList{strings}; }

}  // namespace mavoea::test

using namespace mavoea::test;

extern "C" {

void MLIBCErrSetEx(int code, const char* file, int line) {
    TheState().top = {.code = code, .unit = file, .line = line};
    TheState().records.push_back(TheState().top);
    errno = EDOM;  // The platform's error stack is free to change errno.
}

int MLIBCErrGet(void) { return TheState().top.code; }
const char* MLIBCErrorGetFile(void) { return TheState().top.unit.c_str(); }
int MLIBCErrorGetLine(void) { return TheState().top.line; }

MLIBCSzList* MLIBCSzListAlloc(int) {
    return Refusal("MLIBCSzListAlloc()") == 0 ? NewList() : nullptr;
}

int MLIBCSzListPush(MLIBCSzList** list, const char* text) {
    if (Refusal("MLIBCSzListPush(" + Text(text) + ")") != 0) return -1;
    int& left = TheState().answers.pushes_until_failure;
    if (left == 0) return -1;
    if (left > 0) --left;
    (*list)->strings.emplace_back(text);
    return 0;
}

const char* MLIBCSzListGet(const MLIBCSzList* list, int index) {
    const auto at = static_cast<size_t>(index);
    return at < list->strings.size() ? list->strings[at].c_str() : nullptr;
}

void MLIBCSzListRemoveAll(MLIBCSzList* list) { list->strings.clear(); }
void MLIBCSzListFree(MLIBCSzList* list) { delete list; }

int MLIBCExec(const char* program, ...) {
    std::vector<std::string> argv = {program};
    va_list arguments;
    va_start(arguments, program);
    while (const char* argument = va_arg(arguments, const char*)) argv.emplace_back(argument);
    va_end(arguments);

    std::string call = "MLIBCExec(" + argv[0];
    for (size_t i = 1; i < argv.size(); ++i) call += ", " + argv[i];
    if (const int refusal = NoteCall(call + ")")) return refusal;
    if (TheState().answers.exec) return TheState().answers.exec(argv);

    std::vector<char*> pointers;
    for (std::string& argument : argv) pointers.push_back(argument.data());
    pointers.push_back(nullptr);
    pid_t child = 0;
    if (posix_spawn(&child, program, nullptr, nullptr, pointers.data(), environ) != 0) return -1;
    int status = 0;
    if (waitpid(child, &status, 0) != child) return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

int MLIBCFileStat(const char* path, int option, void* info) {
    const int refusal =
        NoteCall("MLIBCFileStat(" + Text(path) + ", " + std::to_string(option) + ")");
    if (refusal != 0) return refusal;
    auto* const bytes = static_cast<unsigned char*>(info);
    memset(bytes, 0, 128);
    if (TheState().answers.file_stat) return TheState().answers.file_stat(path, bytes);
    struct stat found;
    if (stat(path, &found) != 0) return -1;
    const std::uint32_t mode = found.st_mode;
    memcpy(bytes + 16, &mode, sizeof mode);
    return 0;
}

int MAVOGetFSType(const char* path, int flag) {
    const int refusal = NoteCall("MAVOGetFSType(" + Text(path) + ", " + std::to_string(flag) + ")");
    if (refusal != 0) return refusal;
    return TheState().answers.fs_type ? TheState().answers.fs_type(path, flag) : 1;
}

int MLIBMavoFileIndexAdd(const char* path, const char* old_path, int op) {
    const std::string call = "MLIBMavoFileIndexAdd(" + Text(path) + ", " + Text(old_path) + ", " +
                             std::to_string(op) + ")";
    if (const int refusal = NoteCall(call)) return refusal;
    return TheState().answers.index ? TheState().answers.index(call) : 0;
}

int MLIBMavoIndexAddEx(const char* path, const char* old_path, int op, int reserved1,
                       int reserved2) {
    const std::string call = "MLIBMavoIndexAddEx(" + Text(path) + ", " + Text(old_path) + ", " +
                             std::to_string(op) + ", " + std::to_string(reserved1) + ", " +
                             std::to_string(reserved2) + ")";
    if (const int refusal = NoteCall(call)) return refusal;
    return TheState().answers.index ? TheState().answers.index(call) : 0;
}

int MAVOStrReplaceFATReservedChar(const char* in, char* out, int size) {
    const int refusal = NoteCall("MAVOStrReplaceFATReservedChar(" + Text(in) + ")");
    if (refusal != 0) return refusal;
    const std::string text =
        TheState().answers.fat_replace ? TheState().answers.fat_replace(in) : std::string(in);
    if (std::cmp_greater_equal(text.size(), size)) return -1;
    memcpy(out, text.c_str(), text.size() + 1);
    return 0;
}

int MAVOACLSetEADirACL(const char* path) {
    if (const int refusal = NoteCall("MAVOACLSetEADirACL(" + Text(path) + ")")) return refusal;
    return TheState().answers.acl ? TheState().answers.acl(path) : 0;
}

void syslog(int priority, const char* format, ...) {
    char text[16384];
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    std::string line = WithoutLine(text);
    if (!line.empty() && line.back() == '\n') line.pop_back();
    if (priority == LOG_ERR) {
        TheState().log.push_back(line);
        TheState().log_lines.push_back(LineOf(text));
    }
    errno = EDOM;  // syslog is free to change errno.
}

}  // extern "C"
