#include "tools/record.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "adouble/internal.h"
#include "tools/messages.h"
#include "tools/sidecar.h"
#include "util/bytes.h"

namespace mavoea::tool {
namespace {

const char* AdviceFor(RecordPlace place) {
    return place == RecordPlace::kAttribute
               ? "look at it with: mavoea dump --record PATH"
               : "look at it with: mavoea dump --record PATH, or try mavoea repair PATH";
}

// The largest value that attributes of files have.
constexpr std::size_t kStoredMax = 65536;

const char* Name(RecordPlace place) {
    return place == RecordPlace::kAttribute ? "its netatalk record"
                                            : "the netatalk record of its resource file";
}

}  // namespace

Record::Record(std::string object, RecordPlace place) : object_(std::move(object)), place_(place) {}

std::optional<Record> Record::Read(const std::string& object, RecordPlace place) {
    Record record(object, place);
    const ErrorMark mark;
    const int found = place == RecordPlace::kAttribute
                          ? MAVOEAFileEAAdoubleRead(object.c_str(), &record.record_)
                          : MAVOEAEADirAdoubleRead(object.c_str(), &record.record_);
    if (found == 0) return record;
    if (found > 0) return std::nullopt;
    const LibraryError error = mark.Get();
    // A file system without such attributes holds no records.
    if (place == RecordPlace::kAttribute && error.error == ENOTSUP) return std::nullopt;
    if (error.code == MAVOEA_ERR_OPEN || error.code == MAVOEA_ERR_NAME_TOO_LONG ||
        error.error == EACCES || error.error == EIO) {
        throw LibraryFailure(object, error);
    }
    throw Failure(kFailed, object, std::string(Name(place)) + " is damaged", AdviceFor(place));
}

std::optional<Bytes> Record::FinderInfo() const {
    const ByteView bytes = Entry(Slot::kFinderInfo, kFinderInfoSize);
    const bool any = std::any_of(bytes.begin(), bytes.end(), [](auto byte) { return byte != 0; });
    return any ? std::optional(Bytes(bytes.begin(), bytes.end())) : std::nullopt;
}

void Record::SetFinderInfo(const Bytes& value) {
    const ByteSpan bytes = Entry(Slot::kFinderInfo, kFinderInfoSize);
    if (bytes.empty()) {
        throw Failure(kFailed, object_, std::string(Name(place_)) + " has no room for Finder info",
                      AdviceFor(place_));
    }
    std::copy(value.begin(), value.end(), bytes.begin());
}

std::uint16_t Record::AfpAttributes() const {
    const ByteView info = Entry(Slot::kAfpFileInfo, kAfpFileInfoSize);
    return info.empty() ? std::uint16_t{0} : LoadBe16(&info[kAfpAttributesOffset]);
}

void Record::ClearAfpAttributes(std::uint16_t bits) {
    const ByteSpan info = Entry(Slot::kAfpFileInfo, kAfpFileInfoSize);
    if (info.empty()) return;
    StoreBe16(static_cast<std::uint16_t>(AfpAttributes() & ~bits), &info[kAfpAttributesOffset]);
}

void Record::Flush() const {
    const KeptDescriptor kept;
    const ErrorMark mark;
    const int failed =
        place_ == RecordPlace::kAttribute
            ? MAVOEAFileEAAdoubleFlush(record_.data, int{kAttributeBlockSize}, object_.c_str())
            : MAVOEAEADirAdoubleFlush(record_.data, int{kResourceHeadSize}, object_.c_str());
    if (failed != 0) throw LibraryFailure(object_, mark.Get());
}

ByteSpan Record::Entry(Slot slot, std::size_t size) { return EntryBytes(record_, slot, size); }

ByteView Record::Entry(Slot slot, std::size_t size) const {
    return EntryBytes(const_cast<EAAdouble&>(record_), slot, size);
}

std::optional<StoredRecord> ReadStoredRecord(const Object& object, RecordPlace place) {
    if (place == RecordPlace::kAttribute) {
        Bytes block(kStoredMax);
        const ssize_t size =
            ::getxattr(object.path.c_str(), kNetatalkAttribute, block.data(), block.size());
        if (size < 0) {
            if (errno == ENODATA || errno == ENOTSUP || errno == ENOENT) return std::nullopt;
            throw SystemFailure(object.path, errno);
        }
        block.resize(static_cast<std::size_t>(size));
        return StoredRecord{object.path, std::move(block)};
    }
    const std::string path = Sidecar{object.path, MAVOEA_KIND_RESOURCE, EA_PLACE_EADIR}.Path();
    struct stat info;
    if (::lstat(path.c_str(), &info) != 0) {
        if (errno == ENOENT || errno == ENOTDIR) return std::nullopt;
        throw SystemFailure(path, errno);
    }
    Bytes block = File::OpenToRead(path).Read(0, kResourceHeadSize);
    if (block.size() < kResourceHeadSize) return std::nullopt;
    return StoredRecord{path, std::move(block)};
}

KeptDescriptor::KeptDescriptor() : next_(::fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0)) {
    if (next_ >= 0) ::close(next_);
}

KeptDescriptor::~KeptDescriptor() {
    // The system log's socket may have taken the number, and is the C library's.
    struct stat info;
    if (next_ >= 0 && ::fstat(next_, &info) == 0 && S_ISREG(info.st_mode)) ::close(next_);
}

}  // namespace mavoea::tool
