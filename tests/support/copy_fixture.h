// What the tests of the copy routines have in common: two objects, "a" to copy from and "b" to copy
// to, each in a directory of its own, and the files beside them that hold their metadata.
#ifndef MAVOEA_TESTS_SUPPORT_COPY_FIXTURE_H_
#define MAVOEA_TESTS_SUPPORT_COPY_FIXTURE_H_

#include <errno.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <optional>
#include <regex>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_attributes.h"
#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

class CopyTest : public ::testing::Test {
 protected:
    CopyTest() {
        Reset();
        live_blocks_ = TakeAllocations().live;
        descriptors_ = OpenDescriptors();
    }
    ~CopyTest() override {
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        CallsOfCopyFn() = {};
        CopyFnAnswer() = nullptr;
        ResetKernel();
        ResetPlatform();
    }

    // Two fresh objects; nothing reported, nothing hooked but the attributes.
    void Reset() {
        ResetKernel();
        ResetPlatform();
        CallsOfCopyFn() = {};
        CopyFnAnswer() = nullptr;
        dir_.emplace();
        from_ = *dir_ / "from";
        to_ = *dir_ / "to";
        src_ = from_ + "/a";
        dst_ = to_ + "/b";
        MakeDirectory(from_);
        MakeDirectory(to_);
        for (const std::string& object : {src_, dst_}) {
            WriteFile(object, Ascii("data"));
            ASSERT_EQ(0, chmod(object.c_str(), 0744));
            WriteFile(ForkFile(object), {});
        }
        listed_.reset();
        syncs_ = 0;
        Hooks().geteuid = [] { return uid_t{0}; };  // so that nobody needs to become the superuser
        Hooks().fsync = [](int) { return 0; };
        Hooks().sync = [this] { ++syncs_; };
        StandInForMacAttributes();
        Hooks().listxattr = [this](const char* path, char* names, size_t size) {
            return ListNames(listed_ ? *listed_ : NamesOf(path), names, size);
        };
    }

    // ---- Where metadata lies --------------------------------------------------------------------

    std::string EADir(const std::string& directory) const { return directory + "/@eaDir"; }
    std::string SrcStream() const { return from_ + "/@eaDir/a@MavoEAStream"; }
    std::string SrcResource() const { return from_ + "/@eaDir/a@MavoResource"; }
    std::string SrcDouble() const { return from_ + "/._a"; }
    std::string DstStream() const { return to_ + "/@eaDir/b@MavoEAStream"; }
    std::string DstResource() const { return to_ + "/@eaDir/b@MavoResource"; }
    std::string DstDouble() const { return to_ + "/._b"; }

    static void MakeDirectory(const std::string& path) {
        ASSERT_EQ(0, mkdir(path.c_str(), 0777)) << path << ": " << strerror(errno);
    }

    // A metadata file, in a directory that is made for it.
    static void Put(const std::string& path, const Bytes& bytes) {
        const std::string directory = path.substr(0, path.rfind('/'));
        if (!Exists(directory)) MakeDirectory(directory);
        WriteFile(path, bytes);
    }

    // Something that is there but cannot be opened, by the superuser neither.
    static void PutLoop(const std::string& path) {
        const std::string directory = path.substr(0, path.rfind('/'));
        if (!Exists(directory)) MakeDirectory(directory);
        ASSERT_EQ(0, symlink(path.c_str(), path.c_str()));
    }

    // What there is, or "(none)".
    static Bytes Content(const std::string& path) {
        return Exists(path) ? ReadFile(path) : Ascii("(none)");
    }

    // ---- What was reported ----------------------------------------------------------------------

    // The log with every line number replaced, also that of the record that a line quotes.
    static std::vector<std::string> TakeLines() {
        static const std::regex kQuoted("\\[0x([0-9A-F]{4}) ([a-z_.]*):[0-9]+\\]");
        std::vector<std::string> lines = TakeLog();
        for (std::string& line : lines) line = std::regex_replace(line, kQuoted, "[0x$1 $2:LINE]");
        return lines;
    }

    // A line of the unit.
    static std::string Line(const std::string& text) { return "ea_copy.c:LINE " + text; }

    // The same about the record that was the last one: "none" when there was none.
    static std::string Quoting(const std::string& record, const std::string& text) {
        return Line("[" + (record == "none" ? "0x0000 :LINE" : record + ":LINE") + "]" + text);
    }

    static std::vector<int> Codes(const std::string& unit = "ea_copy.c") {
        std::vector<int> codes;
        for (const Record& record : TakeRecords()) {
            if (record.unit == unit) codes.push_back(record.code);
        }
        return codes;
    }

    // Descriptors and memory are as they were at first.
    void ExpectNothingHeld() const {
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
    }

    // ---- The caller's copy ----------------------------------------------------------------------

    static std::vector<std::string>& CallsOfCopyFn() {
        static std::vector<std::string>& calls = *new std::vector<std::string>;
        return calls;
    }
    static std::function<int()>& CopyFnAnswer() {
        static std::function<int()>& answer = *new std::function<int()>;
        return answer;
    }
    static int CopyFnOfTest(const char* from, const char* to) {
        CallsOfCopyFn().push_back(std::string(from) + " -> " + to);
        if (CopyFnAnswer()) {
            const int result = CopyFnAnswer()();
            if (result != 0) return result;
        }
        WriteFile(to, ReadFile(from));
        return 0;
    }

    std::optional<TempDir> dir_;
    std::string from_, to_;
    std::string src_, dst_;
    std::optional<std::vector<std::string>>
        listed_;  // what listxattr() tells, instead of the truth
    int syncs_ = 0;
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_COPY_FIXTURE_H_
