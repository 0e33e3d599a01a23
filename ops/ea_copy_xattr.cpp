// Copies between real extended attributes and an object's metadata files.

#include <errno.h>
#include <fcntl.h>
#include <string.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "ops/ea_copy.h"
#include "platform/include/mavocore.h"
#include "util/file_io.h"
#include "util/growing_buffer.h"
#include "util/owned.h"
#include "util/path_text.h"

namespace mavoea {
namespace {

constexpr Unit unit = copy_unit;

constexpr char kFinderInfoName[] = "com.apple.FinderInfo";
constexpr char kForkName[] = "com.apple.ResourceFork";

constexpr mode_t kMode = 0777;

// ---- Reading extended attributes ----------------------------------------------------------------

// The names of an object's extended attributes.
class NameList {
 public:
    NameList() : list_(MLIBCSzListAlloc(1024)) {}
    ~NameList() { MLIBCSzListFree(list_); }
    NameList(const NameList&) = delete;
    NameList& operator=(const NameList&) = delete;

    bool Fill(const char* path) { return list_ != nullptr && MAVOEAXattrEnum(path, &list_) >= 0; }
    const char* operator[](int index) const { return MLIBCSzListGet(list_, index); }

 private:
    MLIBCSzList* list_;
};

enum class Fetched { kValue, kFailed, kNoMemory };

// Reads an attribute into `buffer`, which grows where it must. Failures are logged, lack of memory
// is recorded.
Fetched Fetch(const char* path, const char* name, GrowingBuffer* buffer, std::uint32_t* length) {
    const auto read = [&] {
        // Without room the call would tell the length, and no value with it.
        if (buffer->size() == 0) {
            errno = ERANGE;
            return -1;
        }
        return MAVOEAXattrGet(path, name, buffer->data(), static_cast<int>(buffer->size()));
    };
    int size = read();
    if (size < 0 && errno != ERANGE) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Fail to get EA(%s). %m", path);
        return Fetched::kFailed;
    }
    if (size < 0) {
        const int wanted = MAVOEAXattrGet(path, name, buffer->data(), 0);
        if (wanted >= 0 && !buffer->Reach(std::max(static_cast<std::uint32_t>(wanted), 1U))) {
            unit.Fail(Err::kBufferMemory);
            return Fetched::kNoMemory;
        }
        size = wanted < 0 ? -1 : read();
        if (size < 0) {
            unit.LogWrapped("%s:%d [0x%04X %s:%d]Fail to get EA(%s, %s). %m", path, name);
            return Fetched::kFailed;
        }
    }
    *length = static_cast<std::uint32_t>(size);
    return Fetched::kValue;
}

// ---- From metadata files to extended attributes -------------------------------------------------

// Opens a metadata file of src. When that fails errno tells why, whatever it was before: where the
// path of a "._" file would be too long it is left alone.
int OpenToRead(const char* src, const char* kind, int place) {
    const int former = errno;
    errno = ENAMETOOLONG;
    const int fd = MAVOEAOpen(EA_FORM_FILE, src, kind, O_RDONLY | O_CLOEXEC, place);
    if (fd >= 0) errno = former;
    return fd;
}

// Sets the attributes of the stream on fd as dst's. How many failed, each with a code; -1 when
// there is no stream.
int SetAttributes(int fd, const char* dst, GrowingBuffer* value) {
    EASHandle* const stream = MAVOEASOpen(fd, F_RDLCK);
    if (stream == nullptr) return -1;
    int failures = 0;
    const unsigned count = DecodeAttributeCount(stream->header);
    const off_t file_size = kernel::Lseek(fd, 0, SEEK_END);
    for (unsigned i = 0; i < count; ++i) {
        const EASEntry& entry = stream->entries[i];
        std::optional<Err> error = value->Fill(fd, {entry.offset, entry.length}, file_size);
        if (!error && MAVOEAXattrSet(dst, entry.name, value->data(), static_cast<int>(entry.length),
                                     0) != 0) {
            error = Err::kWrite;
        }
        if (!error) continue;
        unit.Fail(*error);
        ++failures;
    }
    (void)MAVOEASClose(stream);
    return failures;
}

// The stream part of the copy. -1 for no failure, -2 and less for failures.
constexpr int kStreamDone = -1;
constexpr int kStreamFailed = -2;

int StreamToXattrs(const char* src, const char* dst, int move, int place, GrowingBuffer* value) {
    const UniqueFd fd(OpenToRead(src, MAVOEA_KIND_STREAM, place));
    if (!fd) {
        if (errno == ENOENT) return kStreamDone;
        unit.Fail(Err::kOpen);
        return kStreamFailed;
    }
    const int failures = SetAttributes(fd.get(), dst, value);
    if (failures < 0) return kStreamFailed;
    if (failures > 0) return kStreamDone - failures;
    if (place == EA_PLACE_EADIR && move != 0) {
        char path[kPathBufferSize];
        if (MAVOEAPath(EA_FORM_FILE, src, MAVOEA_KIND_STREAM, path, kDerivedPathMax,
                       EA_PLACE_EADIR) != 0) {
            return kStreamFailed;
        }
        (void)kernel::Unlink(path);
    }
    return kStreamDone;
}

// Where a resource file has its two entries.
struct ResourceEntries {
    std::uint32_t finder_info = 0;
    Range fork;
};

// 0, or -1 after recording what is wrong with the file.
int FindEntries(int fd, ResourceEntries* found) {
    std::uint8_t bytes[DescriptorsEnd(kStreamDescriptorMax)];
    if (ReadAt(fd, {bytes, AppleDoubleHeader::kSize}, 0) !=
        std::int64_t{AppleDoubleHeader::kSize}) {
        return unit.Fail(Err::kRead);
    }
    BeReader in(bytes);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    if (header.version != kAppleDoubleVersion2) return unit.Fail(Err::kRead);
    if (header.entry_count != 2 && header.entry_count != kStreamDescriptorMax) {
        return unit.Fail(Err::kRead);
    }
    const std::size_t size = DescriptorsEnd(header.entry_count) - AppleDoubleHeader::kSize;
    if (ReadAt(fd, {bytes + AppleDoubleHeader::kSize, size}, AppleDoubleHeader::kSize) !=
        static_cast<std::int64_t>(size)) {
        return unit.Fail(Err::kRead);
    }
    for (std::uint16_t i = 0; i < header.entry_count; ++i) {
        const EntryDescriptor entry = DecodeEntryDescriptor(in);
        if (entry.id == EntryId::kFinderInfo) found->finder_info = entry.data.offset;
        if (entry.id == EntryId::kResourceFork) found->fork = entry.data;
    }
    const bool both = found->finder_info != 0 && found->fork.offset != 0;
    return both ? 0 : unit.Fail(Err::kSystemCall);
}

// The bytes at `place` of the file on fd, as an attribute of dst. 0, or -1 after recording why not.
int SetFromFile(int fd, Range place, const char* dst, const char* name, GrowingBuffer* buffer) {
    const off_t file_size = kernel::Lseek(fd, 0, SEEK_END);
    if (const auto error = buffer->Fill(fd, place, file_size)) return unit.Fail(*error);
    if (MAVOEAXattrSet(dst, name, buffer->data(), static_cast<int>(place.length), 0) != 0) {
        return unit.Fail(Err::kWrite);
    }
    return 0;
}

// The resource part. 0, also without a resource file, or -1 with a code.
int ResourceFileToXattrs(const char* src, const char* dst, int move, int place,
                         GrowingBuffer* value) {
    const UniqueFd fd(OpenToRead(src, MAVOEA_KIND_RESOURCE, place));
    if (!fd) return errno == ENOENT ? 0 : unit.Fail(Err::kOpen);
    ResourceEntries entries;
    if (FindEntries(fd.get(), &entries) != 0) return -1;
    if (entries.fork.length > 0 &&
        SetFromFile(fd.get(), entries.fork, dst, kForkName, value) != 0) {
        return -1;
    }
    const Range finder_info = {entries.finder_info, kFinderInfoSize};
    if (SetFromFile(fd.get(), finder_info, dst, kFinderInfoName, value) != 0) return -1;
    char path[kPathBufferSize];
    if (move != 0 &&
        MAVOEAPath(EA_FORM_FILE, src, MAVOEA_KIND_RESOURCE, path, kDerivedPathMax, place) == 0) {
        (void)kernel::Unlink(path);
    }
    return 0;
}

// ---- From extended attributes to metadata files -------------------------------------------------

// A value that is kept until its file is written.
class KeptValue {
 public:
    bool Keep(ByteView value) {
        bytes_ = Owned<std::uint8_t>::Allocate(std::max<std::size_t>(value.size(), 1));
        if (!bytes_) return false;
        std::copy(value.begin(), value.end(), bytes_.get());
        size_ = value.size();
        return true;
    }

    explicit operator bool() const { return static_cast<bool>(bytes_); }
    ByteView view() const { return {bytes_.get(), size_}; }

 private:
    Owned<std::uint8_t> bytes_;
    std::size_t size_ = 0;
};

// One copy of an object's attributes into its metadata files at another place.
class XattrImport {
 public:
    XattrImport(const char* src, const char* dst, int place)
        : src_(src), dst_(dst), place_(place) {}
    ~XattrImport() {
        const ErrnoKeeper keep;
        if (stream_ != nullptr) (void)MAVOEASClose(stream_);
    }
    XattrImport(const XattrImport&) = delete;
    XattrImport& operator=(const XattrImport&) = delete;

    // 0, or -1 less the failures that have been counted when it ended.
    int Run() {
        if (!buffer_.ok()) return unit.Fail(Err::kBufferMemory);
        if (!names_.Fill(src_) || !FetchResources() || !WriteResourceFile() || !WriteStream()) {
            return result_;
        }
        return result_ == -1 ? 0 : result_;
    }

 private:
    static bool IsResource(const char* name) {
        return strcmp(name, kFinderInfoName) == 0 || strcmp(name, kForkName) == 0;
    }

    // Reads an attribute; none when that failed, which is counted. False when the whole ends with
    // it, because memory ran out.
    bool Read(const char* name, std::optional<ByteView>* value) {
        std::uint32_t length = 0;
        const Fetched fetched = Fetch(src_, name, &buffer_, &length);
        if (fetched == Fetched::kValue) *value = buffer_.First(length);
        if (fetched == Fetched::kFailed) --result_;
        return fetched != Fetched::kNoMemory;
    }

    // The steps below are false when the whole ends with them.

    bool FetchResources() {
        for (int i = 0; const char* const name = names_[i]; ++i) {
            if (!IsResource(name)) continue;
            std::optional<ByteView> value;
            if (!Read(name, &value)) return false;
            if (!value) continue;
            KeptValue* const kept = strcmp(name, kForkName) == 0 ? &fork_ : &finder_info_;
            if (!kept->Keep(*value)) {
                unit.Fail(Err::kBufferMemory);
                --result_;
            }
        }
        return true;
    }

    bool WriteResourceFile() const {
        if (!finder_info_ && !fork_) return true;
        const UniqueFd fd(MAVOEAOpen(EA_FORM_FILE, dst_, MAVOEA_KIND_RESOURCE,
                                     O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, place_));
        if (!fd) {
            unit.LogWrapped("%s:%d [0x%04X %s:%d]Fail to open mavoresource(%s). %m", dst_);
            return unit.Fail(Err::kOpen) == 0;
        }
        const auto head = EncodeResourceHead(static_cast<std::uint32_t>(fork_.view().size()));
        // Finder info that is longer than it should be is written whole, and the fork over it.
        if (!Write(fd.get(), head, 0) || !Write(fd.get(), finder_info_.view(), kFinderInfoOffset) ||
            !Write(fd.get(), fork_.view(), kAttributeHeaderOffset)) {
            return unit.Fail(Err::kWrite) == 0;
        }
        (void)kernel::Fchmod(fd.get(), kMode);
        return true;
    }

    static bool Write(int fd, ByteView bytes, std::uint64_t offset) {
        return bytes.empty() || WriteAt(fd, bytes, offset) == bytes.size();
    }

    bool WriteStream() {
        for (int i = 0; const char* const name = names_[i]; ++i) {
            if (IsResource(name)) continue;
            std::optional<ByteView> value;
            if (!Read(name, &value)) return false;
            if (!value) continue;
            if (stream_ == nullptr && !OpenStream()) return false;
            if (MAVOEASWrite(stream_, name, value->data(), static_cast<unsigned>(value->size()), 0,
                             0) < 0) {
                unit.LogWrapped("%s:%d [0x%04X %s:%d]Fail to write eastream(%s). %m", dst_);
                return unit.Fail(Err::kWrite) == 0;
            }
            (void)MAVOEASFlush(stream_);
        }
        return true;
    }

    bool OpenStream() {
        // On an AppleDouble volume the stream is in the file that has just been written.
        const int flags = place_ == EA_PLACE_APPLEDOUBLE ? O_RDWR : O_RDWR | O_CREAT | O_TRUNC;
        stream_fd_.Reset(
            MAVOEAOpen(EA_FORM_FILE, dst_, MAVOEA_KIND_STREAM, flags | O_CLOEXEC, place_));
        if (stream_fd_) stream_ = MAVOEASOpen(stream_fd_.get(), F_WRLCK);
        if (stream_ == nullptr) {
            unit.LogWrapped("%s:%d [0x%04X %s:%d]Fail to open eastream(%s). %m", dst_);
            return unit.Fail(Err::kOpen) == 0;
        }
        (void)kernel::Fchmod(stream_fd_.get(), kMode);
        return true;
    }

    const char* src_;
    const char* dst_;
    int place_;
    int result_ = -1;
    NameList names_;
    GrowingBuffer buffer_;
    KeptValue finder_info_;
    KeptValue fork_;
    UniqueFd stream_fd_;
    EASHandle* stream_ = nullptr;
};

}  // namespace

int CopyXattrs(const char* src, const char* dst) {
    NameList names;
    if (!names.Fill(src)) return -1;
    GrowingBuffer buffer;
    if (!buffer.ok()) return unit.Fail(Err::kBufferMemory);
    int failures = 0;
    for (int i = 0; const char* const name = names[i]; ++i) {
        std::uint32_t length = 0;
        if (Fetch(src, name, &buffer, &length) != Fetched::kValue) {
            ++failures;
        } else if (MAVOEAXattrSet(dst, name, buffer.data(), static_cast<int>(length), 0) != 0) {
            unit.LogWrapped("%s:%d [0x%04X %s:%d]Fail to set EA(%s, %s). %m", dst, name);
            ++failures;
        }
    }
    return failures == 0 ? 0 : -1;
}

int EACopyEAStreamToXattr(const char* src, const char* dst, int move, int place) {
    GrowingBuffer value;
    if (!value.ok()) return unit.Fail(Err::kBufferMemory);
    const int stream = StreamToXattrs(src, dst, move, place, &value);
    const int resource = ResourceFileToXattrs(src, dst, move, place, &value);
    return stream == kStreamDone && resource == 0 ? 0 : stream;
}

int EACopyToXattrFS(const char* src, const char* dst, int move) {
    if (EACopyEAStreamToXattr(src, dst, move, EA_PLACE_EADIR) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
        return -1;
    }
    kernel::Sync();
    return 0;
}

int EACopyXattrToEAStream(const char* src, const char* dst, int place) {
    return XattrImport(src, dst, place).Run();
}

int EACopyXattrToEADirFS(const char* src, const char* dst, int move) {
    if (EACopyXattrToEAStream(src, dst, EA_PLACE_EADIR) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
        return -1;
    }
    if (move == 1 && EARemoveSrcResource(src) != 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to remove [%s]->[%s]. %m", src, dst);
        return -1;
    }
    return 0;
}

}  // namespace mavoea
