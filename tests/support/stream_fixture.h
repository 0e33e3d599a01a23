// What the tests of EA streams have in common: a file, handles on it, and other processes that look
// at its locks.
#ifndef MAVOEA_TESTS_SUPPORT_STREAM_FIXTURE_H_
#define MAVOEA_TESTS_SUPPORT_STREAM_FIXTURE_H_

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

struct CloseStream {
    void operator()(EASHandle* handle) const { MAVOEASClose(handle); }
};
using Handle = std::unique_ptr<EASHandle, CloseStream>;

// What a handle knows, in a form that compares.
struct HandleState {
    struct Entry {
        std::uint32_t offset, length;
        std::uint16_t flags;
        std::uint8_t name_length;
        std::string name;
        bool operator==(const Entry&) const = default;
    };
    Bytes header;
    std::vector<Entry> entries;
    int lock_type;
    bool operator==(const HandleState&) const = default;
};

inline HandleState StateOf(const EASHandle& handle) {
    HandleState state{Bytes(handle.header, handle.header + 120), {}, handle.lockType};
    for (unsigned i = 0; i < U16At(handle.header, kAttributeCountAt); ++i) {
        const EASEntry& entry = handle.entries[i];
        state.entries.push_back({entry.offset, entry.length, entry.flags, entry.nameLength,
                                 entry.name == nullptr ? "(null)" : entry.name});
    }
    return state;
}

// The lock that another process would meet if it wanted one of `type` on the whole file; F_UNLCK
// when it would get it.
inline int LockInTheWay(const std::string& path, int type) {
    const pid_t child = fork();
    if (child == 0) {
        const int fd = open(path.c_str(), O_RDWR);
        struct flock64 lock = {};
        lock.l_type = static_cast<short>(type);
        lock.l_whence = SEEK_SET;
        _exit(fd >= 0 && fcntl(fd, F_GETLK64, &lock) == 0 ? lock.l_type : 100);
    }
    int status = 0;
    if (child < 0 || waitpid(child, &status, 0) != child || !WIFEXITED(status)) return 101;
    return WEXITSTATUS(status);
}

// Another process that has opened the stream at `path` through the library, and keeps the handle
// until Release().
class OtherProcess {
 public:
    OtherProcess(const std::string& path, int lock_type) {
        int ready[2];
        int release[2];
        if (pipe(ready) != 0 || pipe(release) != 0) abort();
        pid_ = fork();
        if (pid_ < 0) abort();
        if (pid_ == 0) {
            ::close(release[1]);
            const int fd = ::open(path.c_str(), O_RDWR);
            EASHandle* const handle = MAVOEASOpen(fd, lock_type);
            const int code = handle != nullptr ? 0 : MLIBCErrGet();
            if (::write(ready[1], &code, sizeof code) != sizeof code) _exit(1);
            char byte;
            if (::read(release[0], &byte, 1) < 0) _exit(1);
            _exit(handle != nullptr && MAVOEASClose(handle) != 0 ? 2 : 0);
        }
        ::close(ready[1]);
        ::close(release[0]);
        if (::read(ready[0], &code_, sizeof code_) != sizeof code_) code_ = -1;
        ::close(ready[0]);
        release_ = release[1];
    }
    ~OtherProcess() { Release(); }
    OtherProcess(const OtherProcess&) = delete;
    OtherProcess& operator=(const OtherProcess&) = delete;

    // The code of its failure to open, 0 when it has the handle.
    int code() const { return code_; }
    pid_t pid() const { return pid_; }

    void Release() {
        if (release_ < 0) return;
        if (::write(release_, "r", 1) != 1) abort();
        ::close(release_);
        release_ = -1;
        int status = 0;
        EXPECT_EQ(pid_, waitpid(pid_, &status, 0));
        EXPECT_EQ(0, status);
    }

 private:
    pid_t pid_ = -1;
    int release_ = -1;
    int code_ = -1;
};

class StreamTest : public ::testing::Test {
 protected:
    StreamTest() : path_(dir_ / "stream"), fd_(::open(path_.c_str(), O_RDWR | O_CREAT, 0666)) {
        if (fd_ < 0) abort();
        ResetKernel();
        ResetPlatform();
        Hooks().fsync = [](int) { return 0; };  // The calls are counted; the disk need not spin.
    }
    ~StreamTest() override {
        ResetKernel();
        ResetPlatform();
        ::close(fd_);
    }

    // The file is filled and looked at through its one descriptor: closing another would drop the
    // locks that handles hold.
    void Fill(const Bytes& bytes) const {
        if (ftruncate(fd_, 0) != 0) abort();
        std::size_t done = 0;
        while (done < bytes.size()) {
            const ssize_t wrote =
                ::pwrite(fd_, bytes.data() + done, bytes.size() - done, static_cast<off_t>(done));
            if (wrote <= 0) abort();
            done += static_cast<std::size_t>(wrote);
        }
    }
    void Fill(const StreamImage& image) const { Fill(image.Build()); }

    std::uint64_t FileSize() const {
        struct stat info;
        if (fstat(fd_, &info) != 0) abort();
        return static_cast<std::uint64_t>(info.st_size);
    }

    Bytes Contents(std::size_t size, std::uint64_t at = 0) const {
        Bytes bytes(size);
        std::size_t done = 0;
        while (done < size) {
            const ssize_t got =
                ::pread(fd_, bytes.data() + done, size - done, static_cast<off_t>(at + done));
            if (got <= 0) break;
            done += static_cast<std::size_t>(got);
        }
        bytes.resize(done);
        return bytes;
    }
    Bytes Contents() const { return Contents(static_cast<std::size_t>(FileSize())); }

    Handle Open(int lock_type = F_WRLCK) const { return Handle(MAVOEASOpen(fd_, lock_type)); }

    static int Write(const Handle& handle, const std::string& name, const Bytes& value,
                     unsigned offset = 0, int flags = EAS_WRITE_OVERWRITE) {
        return MAVOEASWrite(handle.get(), name.c_str(), value.data(),
                            static_cast<unsigned>(value.size()), offset, flags);
    }
    static int Write(const Handle& handle, const std::string& name, const char* value,
                     unsigned offset = 0, int flags = EAS_WRITE_OVERWRITE) {
        return Write(handle, name, Ascii(value), offset, flags);
    }

    // The whole value, or what its length or reading gave instead.
    static Bytes Read(const Handle& handle, const std::string& name) {
        Bytes value(1);
        const int length = MAVOEASRead(handle.get(), name.c_str(), value.data(), 0, 0);
        if (length < 0) return Ascii("(no length)");
        value.resize(static_cast<std::size_t>(length) + 1);
        const int count = MAVOEASRead(handle.get(), name.c_str(), value.data(),
                                      static_cast<unsigned>(length) + 1, 0);
        if (count != length) return Ascii("(not read)");
        value.resize(static_cast<std::size_t>(count));
        return value;
    }

    static std::vector<std::string> Names(const Handle& handle) {
        MLIBCSzList* list = NewList();
        const int count = MAVOEASEnum(handle.get(), &list);
        std::vector<std::string> names = Strings(list);
        MLIBCSzListFree(list);
        EXPECT_EQ(static_cast<int>(names.size()), count);
        return names;
    }

    static std::vector<int> TakeCodes() {
        std::vector<int> codes;
        for (const Record& record : TakeRecords()) codes.push_back(record.code);
        return codes;
    }

    // The calls since the last time that read, write, size or sync the file.
    static std::vector<std::string> TakeFileCalls() {
        std::vector<std::string> calls = TakeCalls();
        std::erase_if(calls, [](const std::string& call) {
            return call.starts_with("fstat(") || call.starts_with("lseek(");
        });
        return calls;
    }
    static std::vector<std::string> TakeWrites() {
        std::vector<std::string> calls = TakeFileCalls();
        std::erase_if(calls, [](const std::string& call) { return call.starts_with("pread"); });
        return calls;
    }

    // Matches the one write of `size` bytes at the start of the file that puts header, table and
    // values on disk, gathered or not.
    static ::testing::Matcher<const std::string&> WriteOfAll(std::size_t size) {
        const std::string arguments = "(" + std::to_string(size) + ", 0)";
        return ::testing::AnyOf("pwrite" + arguments, "pwritev" + arguments);
    }

    TempDir dir_;
    std::string path_;
    int fd_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_STREAM_FIXTURE_H_
