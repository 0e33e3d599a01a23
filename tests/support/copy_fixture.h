// What the tests of the copy routines have in common: two objects, "a" to copy from and "b" to copy
// to, each in a directory of its own, and the files beside them that hold their metadata.
#ifndef MAVOEA_TESTS_SUPPORT_COPY_FIXTURE_H_
#define MAVOEA_TESTS_SUPPORT_COPY_FIXTURE_H_

#include <errno.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <map>
#include <optional>
#include <regex>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

using Attributes = std::map<std::string, Bytes>;

// No filesystem here has the names that Macs use: "com.apple.FinderInfo" stands under a user name,
// and "<object>/rsrc" for a file elsewhere. Every other attribute is a real one.
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
        Hooks().stat = [](const char* path, struct stat* info) {
            return ::stat(Viewed(path).c_str(), info);
        };
        Hooks().fopen = [](const char* path, const char* mode) {
            return ::fopen(Viewed(path).c_str(), mode);
        };
        Hooks().getxattr = [](const char* path, const char* name, void* value, size_t size) {
            return ::getxattr(path, RealName(name).c_str(), value, size);
        };
        Hooks().setxattr = [](const char* path, const char* name, const void* value, size_t size,
                              int flags) {
            return ::setxattr(path, RealName(name).c_str(), value, size, flags);
        };
        Hooks().listxattr = [this](const char* path, char* names, size_t size) -> ssize_t {
            std::string all;
            for (const std::string& name : listed_ ? *listed_ : NamesOf(path)) all += name + '\0';
            if (size == 0) return static_cast<ssize_t>(all.size());
            if (all.size() > size) {
                errno = ERANGE;
                return -1;
            }
            memcpy(names, all.data(), all.size());
            return static_cast<ssize_t>(all.size());
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

    // ---- Attributes -----------------------------------------------------------------------------

    static std::string RealName(const std::string& name) {
        return name == "com.apple.FinderInfo" ? "user.test.FinderInfo" : name;
    }
    static std::string ForkFile(const std::string& object) { return object + ".fork"; }
    static std::string Viewed(const std::string& path) {
        constexpr std::string_view kView = "/rsrc";
        if (!path.ends_with(kView)) return path;
        return ForkFile(path.substr(0, path.size() - kView.size()));
    }

    static void SetAttribute(const std::string& object, const std::string& name,
                             const Bytes& value) {
        if (name == "com.apple.ResourceFork") {
            WriteFile(ForkFile(object), value);
            return;
        }
        ASSERT_EQ(0,
                  ::setxattr(object.c_str(), RealName(name).c_str(), value.data(), value.size(), 0))
            << name << ": " << strerror(errno);
    }

    // The real ones, sorted, and the fork where it is not empty.
    static std::vector<std::string> NamesOf(const std::string& object) {
        char names[4096];
        const ssize_t size = ::listxattr(object.c_str(), names, sizeof names);
        std::vector<std::string> all;
        for (const char* name = names; name < names + size; name += strlen(name) + 1) {
            if (strncmp(name, "user.", 5) != 0) continue;
            const bool finder_info = strcmp(name, "user.test.FinderInfo") == 0;
            all.emplace_back(finder_info ? "com.apple.FinderInfo" : name);
        }
        if (Exists(ForkFile(object)) && !ReadFile(ForkFile(object)).empty()) {
            all.emplace_back("com.apple.ResourceFork");
        }
        std::sort(all.begin(), all.end());
        return all;
    }

    static Attributes AttributesOf(const std::string& object) {
        Attributes found;
        for (const std::string& name : NamesOf(object)) {
            if (name == "com.apple.ResourceFork") {
                found[name] = ReadFile(ForkFile(object));
                continue;
            }
            Bytes value(65536);
            const ssize_t size =
                ::getxattr(object.c_str(), RealName(name).c_str(), value.data(), value.size());
            value.resize(size < 0 ? 0 : static_cast<size_t>(size));
            found[name] = value;
        }
        return found;
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
