// Rewrites AppleDouble files into the layout that the library's resource files have.

#include "ops/ea_copy_adouble.h"

#include <errno.h>
#include <string.h>
#include <strings.h>

#include <algorithm>
#include <string_view>

#include "format/apple_double.h"
#include "util/file_io.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_copy.c");  // one with the copy operations
constexpr char kFunction[] = "EACopyAdoubleV2";

enum Result {
    kDone = 0,
    kRefused = -1,
    kNotOpened = -2,
    kFailed = -5,
    kNoSpace = -9,
    kIoError = -13,
    kNoMode = -14,
    kIconName = -32,
    kReservedCharacter = -33,
};

int ReadFailure(int error) { return error == EIO ? kIoError : kFailed; }
int WriteFailure(int error) { return error == ENOSPC ? kNoSpace : ReadFailure(error); }

// ---- Names --------------------------------------------------------------------------------------

int CheckName(std::string_view dst) {
    if (dst.size() < 2 || strncasecmp(dst.data(), "._", 2) != 0) return kDone;
    const std::string_view name = dst.substr(2);
    if (strcasecmp(name.data(), "Icon\r") == 0) return kIconName;
    if (name.find_first_of("\\/:*?\"><|\r\n") != std::string_view::npos) return kReservedCharacter;
    return kDone;
}

// ---- Copies by /bin/cp --------------------------------------------------------------------------

// A shell's command line, put together in a buffer of its own. What does not fit makes it no
// command at all.
class CommandLine {
 public:
    CommandLine& Add(std::string_view text) {
        if (text.size() >= sizeof text_ - size_) {
            fits_ = false;
        } else {
            memcpy(text_ + size_, text.data(), text.size());
            size_ += text.size();
        }
        text_[size_] = '\0';
        return *this;
    }

    // Quoted, so that the shell takes nothing in it for its own; a path that begins with '-' is no
    // option.
    CommandLine& AddPath(std::string_view path) {
        Add(path.starts_with('-') ? "'./" : "'");
        for (const char& c : path) Add(c == '\'' ? "'\\''" : std::string_view(&c, 1));
        return Add("'");
    }

    const char* text() const { return fits_ ? text_ : nullptr; }

 private:
    char text_[4096] = {};
    std::size_t size_ = 0;
    bool fits_ = true;
};

int CopyAsItIs(const char* src, const char* dst) {
    CommandLine command;
    command.Add("/bin/cp -f ").AddPath(src).Add(" ").AddPath(dst).Add(" > /dev/null 2>&1");
    if (!AreMetadataOrMissing(src, dst)) return kRefused;
    return command.text() != nullptr && kernel::System(command.text()) == 0 ? kDone : kRefused;
}

// ---- Rewriting ----------------------------------------------------------------------------------

constexpr std::uint16_t kEntryCount = 2;
constexpr std::size_t kDescriptorsSize = DescriptorsEnd(kEntryCount);
constexpr Range kFinderInfoPlace = {static_cast<std::uint32_t>(kDescriptorsSize), kFinderInfoSize};
constexpr auto kForkOffset = static_cast<std::uint32_t>(kFinderInfoPlace.end());

bool IsBlank(int fd, Range fork) {
    if (fork.length <= kBlankForkTextOffset + kBlankForkText.size()) return false;
    std::uint8_t text[kBlankForkText.size()];
    return ReadAt(fd, text, fork.offset + std::uint64_t{kBlankForkTextOffset}) ==
               std::int64_t{sizeof text} &&
           memcmp(text, kBlankForkText.data(), sizeof text) == 0;
}

// Whether all of `bytes` could be read; errno is 0 where the file only ends before.
bool ReadWhole(int fd, ByteSpan bytes, std::uint64_t offset) {
    errno = 0;
    return ReadAt(fd, bytes, offset) == static_cast<std::int64_t>(bytes.size());
}

bool ReadHeader(int fd, AppleDoubleHeader* header) {
    std::uint8_t bytes[AppleDoubleHeader::kSize];
    if (!ReadWhole(fd, bytes, 0)) return false;
    BeReader in(bytes);
    *header = DecodeAppleDoubleHeader(in);
    return true;
}

// Gives each of `count` descriptors to `take`, until it says stop by a result other than kDone,
// which is then *result. False when they cannot be read.
template <class Take>
bool ReadDescriptors(int fd, std::uint16_t count, int* result, Take take) {
    constexpr std::size_t kAtOnce = 128;
    std::uint8_t bytes[kAtOnce * EntryDescriptor::kSize];
    std::uint64_t at = AppleDoubleHeader::kSize;
    *result = kDone;
    for (std::size_t left = count; left > 0;) {
        const std::size_t here = std::min(left, kAtOnce);
        const ByteSpan part(bytes, here * EntryDescriptor::kSize);
        if (!ReadWhole(fd, part, at)) return false;
        BeReader in(part);
        for (std::size_t i = 0; i < here; ++i) {
            *result = take(DecodeEntryDescriptor(in));
            if (*result != kDone) return true;
        }
        left -= here;
        at += part.size();
    }
    return true;
}

// One rewrite: src and dst open, dst written from its start on.
class Rewrite {
 public:
    Rewrite(const char* src, int from, const char* dst, int to)
        : src_(src), from_(from), dst_(dst), to_(to) {}

    int Run() {
        int result = WriteHead();
        if (result == kDone) result = CopyEntries();
        if (result == kDone && kernel::Fchmod(to_, 0777) != 0) {
            result = errno == EIO ? kIoError : kNoMode;
        }
        return result;
    }

 private:
    int WriteHead() {
        AppleDoubleHeader header;
        if (!ReadHeader(from_, &header)) return CannotRead();
        const std::uint16_t count = header.entry_count;
        header.entry_count = kEntryCount;
        std::uint8_t bytes[AppleDoubleHeader::kSize];
        BeWriter out(bytes);
        EncodeAppleDoubleHeader(header, out);
        if (!Append(bytes)) return CannotWrite();

        int result = kDone;
        const bool read = ReadDescriptors(from_, count, &result, [&](const EntryDescriptor& entry) {
            return WriteDescriptor(entry, count);
        });
        if (!read) return CannotRead();
        // With one of them missing, or there twice, nothing behind them would lie where they say.
        if (result == kDone && (!has_finder_info_ || !has_fork_)) result = kFailed;
        return result;
    }

    int WriteDescriptor(EntryDescriptor entry, std::uint16_t count) {
        if (entry.id != EntryId::kFinderInfo && entry.id != EntryId::kResourceFork) return kDone;
        if (count != kEntryCount && count != 13) return kFailed;
        bool* const seen = entry.id == EntryId::kFinderInfo ? &has_finder_info_ : &has_fork_;
        if (*seen) return kFailed;
        *seen = true;
        if (entry.id == EntryId::kFinderInfo) {
            entry.data = kFinderInfoPlace;
        } else {
            fork_length_ = IsBlank(from_, entry.data) ? 0 : entry.data.length;
            entry.data = {kForkOffset, fork_length_};
        }
        std::uint8_t bytes[EntryDescriptor::kSize];
        BeWriter out(bytes);
        EncodeEntryDescriptor(entry, out);
        return Append(bytes) ? kDone : CannotWrite();
    }

    // Where src has the two entries, looked up once more; where the rewritten file has them if that
    // cannot be read.
    struct Offsets {
        std::uint32_t finder_info = kFinderInfoPlace.offset;
        std::uint32_t fork = kForkOffset;
    };
    Offsets FindEntries() const {
        Offsets found;
        AppleDoubleHeader header;
        int result = kDone;
        const bool read =
            ReadHeader(from_, &header) &&
            ReadDescriptors(from_, header.entry_count, &result, [&](const EntryDescriptor& entry) {
                if (entry.id == EntryId::kFinderInfo) found.finder_info = entry.data.offset;
                if (entry.id == EntryId::kResourceFork) found.fork = entry.data.offset;
                return kDone;
            });
        if (read) return found;
        unit.Log("%s:%d(%s) failed to read, reason=%s.\n", "EAGetEntriesBuf", strerror(errno));
        return {};
    }

    int CopyEntries() {
        const Offsets offsets = FindEntries();
        int result = CopyArea({offsets.finder_info, kFinderInfoSize});
        // What a file that ends too soon has no bytes for is no Finder info.
        static constexpr std::uint8_t kNothing[kFinderInfoSize] = {};
        if (result == kDone && written_ < kForkOffset &&
            !Append(ByteView(kNothing).first(static_cast<std::size_t>(kForkOffset - written_)))) {
            result = CannotWriteArea();
        }
        if (result == kDone) result = CopyArea({offsets.fork, fork_length_});
        return result;
    }

    // Appends what src has of `area`.
    int CopyArea(Range area) {
        constexpr std::uint32_t kStep = 16384;
        std::uint8_t bytes[kStep];
        if (kernel::Lseek(from_, area.offset, SEEK_SET) < 0) return kIoError;
        for (std::uint32_t done = 0; done < area.length;) {
            const std::uint32_t want = std::min(kStep, area.length - done);
            const std::int64_t got =
                ReadAt(from_, {bytes, want}, area.offset + std::uint64_t{done});
            if (got < 0) {
                unit.Log("%s:%d(%s) failed to read %s, cRead=%d, cToRead=%d, reason=%s.\n",
                         kFunction, src_, static_cast<int>(got), static_cast<int>(want),
                         strerror(errno));
                return ReadFailure(errno);
            }
            if (got == 0) break;
            if (!Append({bytes, static_cast<std::size_t>(got)})) return CannotWriteArea();
            done += static_cast<std::uint32_t>(got);
        }
        return kDone;
    }

    bool Append(ByteView bytes) {
        const std::uint64_t size = WriteAt(to_, bytes, written_);
        written_ += size;
        return size == bytes.size();
    }

    int CannotRead(int line = __builtin_LINE()) const {
        unit.LogAt(line, "%s:%d(%s) failed to read %s, reason=%s.\n", kFunction, src_,
                   strerror(errno));
        return ReadFailure(errno);
    }
    int CannotWrite(int line = __builtin_LINE()) const {
        unit.LogAt(line, "%s:%d(%s) failed to write to %s, reason=%s.\n", kFunction, dst_,
                   strerror(errno));
        return WriteFailure(errno);
    }
    int CannotWriteArea(int line = __builtin_LINE()) const {
        unit.LogAt(line, "%s:%d(%s) failed to write %s, reason=%s.\n", kFunction, dst_,
                   strerror(errno));
        return WriteFailure(errno);
    }

    const char* src_;
    int from_;
    const char* dst_;
    int to_;
    std::uint64_t written_ = 0;
    bool has_finder_info_ = false;
    bool has_fork_ = false;
    std::uint32_t fork_length_ = 0;
};

constexpr int kWrite = O_WRONLY | O_CREAT | O_CLOEXEC;

// Opens src to see what it is. kDone with *rewrite false when there is nothing to rewrite.
int Examine(const char* src, bool* rewrite) {
    *rewrite = false;
    const UniqueFd fd(kernel::OpenToRead(src));
    if (fd.get() == 0) errno = EBADF;  // Standard input's place is no file's.
    if (fd.get() < 1) {
        if (errno == ENOENT) return kDone;
        unit.Log("%s:%d failed to open %s, reason=%s.\n", src, strerror(errno));
        return kNotOpened;
    }
    struct stat info;
    if (kernel::Fstat(fd.get(), &info) == 0 && info.st_size == 0) return kDone;

    AppleDoubleHeader header;
    if (!ReadHeader(fd.get(), &header)) {
        unit.Log("%s:%d failed to read %s, reason=%s.\n", src, strerror(errno));
        return ReadFailure(errno);
    }
    if (header.version == kAppleDoubleVersion1) {
        unit.Log("%s:%d Apple double v1 doens't support now");  // sic
        return kRefused;
    }
    if (header.version != kAppleDoubleVersion2) return kRefused;
    *rewrite = true;
    return kDone;
}

// Opens src; *from stays empty when there is nothing to rewrite.
int OpenSource(const char* src, UniqueFd* from) {
    bool rewrite = false;
    const int examined = Examine(src, &rewrite);
    if (!rewrite) return examined;
    from->Reset(kernel::OpenToRead(src));
    return *from || errno == ENOENT ? kDone : EARewriteNotOpened(src);
}

int RewriteFile(const char* src, const char* dst) {
    UniqueFd from;
    const int opened = OpenSource(src, &from);
    if (!from) return opened;
    UniqueFd to(kernel::OpenRegular(dst, kWrite, 0600));
    if (!to) return EARewriteNotOpened(dst);
    const int result = Rewrite(src, from.get(), dst, to.get()).Run();
    if (result != kDone) {
        const ErrnoKeeper keep;
        to.Reset(-1);
        (void)kernel::Unlink(dst);
    }
    return result;
}

}  // namespace

int EACopyAdoubleV2(const char* src, const char* dst, int mode) {
    if (src == nullptr || dst == nullptr) return kRefused;
    if (mode == kRewriteChecked || mode == kCopyChecked) {
        const int named = CheckName(dst);
        if (named != kDone) return named;
    }
    return mode == kCopy || mode == kCopyChecked ? CopyAsItIs(src, dst) : RewriteFile(src, dst);
}

int EARewriteAdouble(const char* src, const char* dst, int to) {
    UniqueFd from;
    const int opened = OpenSource(src, &from);
    return from ? Rewrite(src, from.get(), dst, to).Run() : opened;
}

int EARewriteNotOpened(const char* path, int line) {
    unit.LogAt(line, "%s:%d(%s) failed to open %s, reason=%s.\n", kFunction, path, strerror(errno));
    return kNotOpened;
}

}  // namespace mavoea
