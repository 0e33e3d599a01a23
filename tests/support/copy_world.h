// An object with metadata in every place at once, and the place where it is copied to, for tests of
// the copy. Extended attributes are kept in memory, so that those have a place that no filesystem
// of ours gives one; external commands run in this process unless a test asks for the real ones.
#ifndef MAVOEA_TESTS_SUPPORT_COPY_WORLD_H_
#define MAVOEA_TESTS_SUPPORT_COPY_WORLD_H_

#include <errno.h>
#include <gmock/gmock.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"

namespace mavoea::test {

inline constexpr char kAppleDoubleFile[] = "._object";
inline constexpr char kEADirectory[] = "@eaDir/";
inline constexpr char kResourceFile[] = "@eaDir/object@MavoResource";
inline constexpr char kStreamFile[] = "@eaDir/object@MavoEAStream";
inline constexpr char kFolder[] = "@eaDir/object/";
inline constexpr char kThumb[] = "@eaDir/object/MAVOThumb";
inline constexpr char kSub[] = "@eaDir/object/sub/";
inline constexpr char kInner[] = "@eaDir/object/sub/inner";

inline constexpr time_t kWorldTime = 0x41424344;

inline constexpr char kFinderInfoAttribute[] = "com.apple.FinderInfo";
inline constexpr char kForkAttribute[] = "com.apple.ResourceFork";
inline constexpr char kRecordAttribute[] = "user.netatalk.Metadata";
inline constexpr char kFlushTimeAttribute[] = "user.mavo.filea.flushtime";

inline std::string Text(const Bytes& bytes) { return std::string(bytes.begin(), bytes.end()); }

// All that stands at one end: files by their path below it (directories end in '/'), "attribute
// <name>" of the object, and "mode" of the object. Of a netatalk record only the Finder info.
using Side = std::map<std::string, std::string>;

class CopyWorld : private Identity {
 public:
    CopyWorld() {
        ResetKernel();
        ResetPlatform();
        BeUser(0);
        Fill();
        StandIn();
        current_ = this;
        (void)TakeCalls();
    }
    ~CopyWorld() {
        current_ = nullptr;
        ResetKernel();
        ResetPlatform();
    }

    // What a filesystem type of the source's or the destination's volume is answered with.
    int src_type = 1;
    int dst_type = 1;

    std::vector<std::string> copied;    // calls of CopyFn(): "<from> <to>"
    std::vector<std::string> archived;  // objects whose archive bit has been set
    std::vector<std::string> commands;  // of the platform's system call: "<path> <command>"
    std::function<int(const std::string& from, const std::string& to)> copier = CopyOver;
    int archive_result = 0;

    // One copy; checks that it leaks nothing, and puts the types' question marks back.
    struct Call {
        int move = 0;
        int copy_eadir = 0;
        int src_type = -1;
        int dst_type = -1;
        int file_index = 0;
        int index = 0;
        bool with_copier = false;
    };
    int Copy(const Call& call) {
        std::string dst = dst_;
        return CopyPaths(src_.c_str(), dst.data(), call);
    }
    static int CopyPaths(const char* src, char* dst, const Call& call) {
        const long descriptors = OpenDescriptors();
        const int live = TakeAllocations().live;
        const std::string before = dst == nullptr ? "" : dst;
        const int result =
            MAVOEACopyEx(src, dst, call.move, call.copy_eadir, call.src_type, call.dst_type,
                         call.file_index, call.index, call.with_copier ? CopyFn : nullptr);
        EXPECT_EQ(before, dst == nullptr ? "" : dst);
        EXPECT_EQ(live, TakeAllocations().live);
        EXPECT_EQ(descriptors, OpenDescriptors());
        return result;
    }
    static int CopyFn(const char* from, const char* to) {
        current_->copied.push_back(current_->Short(std::string(from) + " " + to));
        return current_->copier(from, to);
    }

    // A file below the source ("src/...") or destination ("dst/..."); its directories are made.
    void Put(const std::string& name, const Bytes& bytes) const {
        const std::string path = dir_ / name;
        std::filesystem::create_directories(std::filesystem::path(path).parent_path());
        WriteFile(path, bytes);
    }
    void Remove(const std::string& name) const { std::filesystem::remove_all(dir_ / name); }
    std::string operator/(const std::string& name) const { return dir_ / name; }
    bool Has(const std::string& name) const { return Exists(dir_ / name); }

    void SetAttribute(const std::string& path, const std::string& name, const Bytes& value) {
        for (auto& [key, bytes] : attributes_[path]) {
            if (key != name) continue;
            bytes = value;
            return;
        }
        attributes_[path].emplace_back(name, value);
    }
    void ClearAttributes(const std::string& path) { attributes_.erase(path); }

    Side SideAt(const std::string& end) const {
        Side side;
        const std::string root = dir_ / end;
        for (const auto& entry : std::filesystem::recursive_directory_iterator(root)) {
            const std::string path = entry.path().string();
            const std::string name = path.substr(root.size() + 1);
            if (entry.is_symlink()) {
                side[name] = "-> " + std::filesystem::read_symlink(path).string();
            } else if (entry.is_directory()) {
                side[name + "/"] = "";
            } else if (entry.is_regular_file()) {
                side[name] = Text(ReadFile(path));
            } else {
                side[name] = "(special)";
            }
        }
        const std::string object = root + "/object";
        if (const auto found = attributes_.find(object); found != attributes_.end()) {
            for (const auto& [name, value] : found->second) {
                if (name == kForkAttribute) continue;
                const bool record = name == kRecordAttribute && value.size() == 402;
                side["attribute " + name] =
                    Text(record ? Bytes(value.begin() + 122, value.begin() + 154) : value);
            }
        }
        if (const Bytes fork = ReadFile(ForkOf(object)); !fork.empty()) {
            side[std::string("attribute ") + kForkAttribute] = Text(fork);
        }
        char mode[8];
        snprintf(mode, sizeof mode, "%04o", static_cast<unsigned>(ModeOf(object)));
        side["mode"] = mode;
        return side;
    }

    // The names in the source's folder in the order in which a directory gives them.
    std::vector<std::string> FolderOrder() const {
        std::vector<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator(dir_ / "src/@eaDir/object")) {
            names.push_back(entry.path().filename().string());
        }
        return names;
    }

    // Without the temporary directory in front of every path.
    std::string Short(std::string text) const {
        const std::string prefix = dir_.path() + "/";
        for (auto at = text.find(prefix); at != std::string::npos; at = text.find(prefix, at)) {
            text.erase(at, prefix.size());
        }
        return text;
    }
    std::vector<std::string> Short(std::vector<std::string> texts) const {
        for (std::string& text : texts) text = Short(text);
        return texts;
    }
    std::vector<std::string> TakePlatform() const { return Short(TakePlatformCalls()); }
    std::vector<std::string> TakeLines() const { return Short(TakeLog()); }
    std::vector<std::string> TakeKernel() const { return Short(TakeCalls()); }

    const std::string& src() const { return src_; }
    const std::string& dst() const { return dst_; }

    // ---- The commands, in this process ----

    static int CopyOver(const std::string& from, const std::string& to) {
        std::error_code error;
        std::filesystem::copy_file(from, to, std::filesystem::copy_options::overwrite_existing,
                                   error);
        return error ? 1 : 0;
    }
    static int RunHere(const std::vector<std::string>& argv) {
        std::error_code error;
        if (argv.size() == 4 && argv[0] == "/bin/cp" && argv[1] == "-f") {
            return CopyOver(argv[2], argv[3]);
        }
        if (argv.size() == 4 && argv[0] == "/bin/mv" && argv[1] == "-f") {
            std::filesystem::rename(argv[2], argv[3], error);
            return error ? 1 : 0;
        }
        if (argv.size() == 3 && argv[0] == "/bin/rm" && argv[1] == "-rf") {
            std::filesystem::remove_all(argv[2], error);
            return error ? 1 : 0;
        }
        ADD_FAILURE() << "no such command: " << ::testing::PrintToString(argv);
        return -1;
    }

 private:
    void Fill() {
        Put("src/object", Ascii("data"));
        Put("dst/object", Ascii("data"));
        StreamImage apple_double;
        apple_double.attributes = {{"user.ad", Ascii("from the AppleDouble file")}};
        apple_double.finder_info = Pattern(32, 0x10);
        apple_double.fork = Ascii("fork of the AppleDouble file");
        Put(std::string("src/") + kAppleDoubleFile, apple_double.Build());
        Put(std::string("src/") + kResourceFile,
            PlainAppleDouble(Pattern(32, 0x20), Ascii("fork of the resource file"), 13));
        StreamImage stream;
        stream.attributes = {{"user.ea", Ascii("from the stream")}};
        Put(std::string("src/") + kStreamFile, stream.Build());
        Put(std::string("src/") + kThumb, Ascii("thumb"));
        Put(std::string("src/") + kInner, Ascii("inner"));
        SetAttribute(src_, "user.x", Ascii("from the attributes"));
        SetAttribute(src_, kFinderInfoAttribute, Pattern(32, 0x70));
        SetAttribute(src_, kForkAttribute, {});
        SetAttribute(src_, kRecordAttribute, AttributeRecord());
        WriteFile(ForkOf(src_), Ascii("fork of the attributes"));
        WriteFile(ForkOf(dst_), {});  // The view is always there; an empty fork is none.
        for (const std::string& object : {src_, dst_}) {
            if (chmod(object.c_str(), 0644) != 0) abort();
        }
    }

    // What the view "<object>/rsrc" of an object's fork is here.
    std::string ForkOf(const std::string& object) const {
        return dir_ / (object == src_ ? "fork-src" : "fork-dst");
    }
    std::string Real(const std::string& path) const {
        constexpr std::string_view kView = "/rsrc";
        if (!path.ends_with(kView)) return path;
        return ForkOf(path.substr(0, path.size() - kView.size()));
    }

    Bytes* Find(const std::string& path, const std::string& name) {
        for (auto& [key, value] : attributes_[path]) {
            if (key == name) return &value;
        }
        return nullptr;
    }

    void StandIn() {
        KernelHooks& hooks = Hooks();
        hooks.sync = [] {};
        hooks.fsync = [](int) { return 0; };
        hooks.time = [] { return kWorldTime; };
        // An upgrade asks what was read last: all at the same time.
        hooks.stat = [this](const char* path, struct stat* info) {
            const int result = ::stat(Real(path).c_str(), info);
            if (result == 0) info->st_atim = {.tv_sec = kWorldTime, .tv_nsec = 0};
            return result;
        };
        hooks.fopen = [this](const char* path, const char* mode) {
            return ::fopen(Real(path).c_str(), mode);
        };
        hooks.listxattr = [this](const char* path, char* names, size_t size) -> ssize_t {
            std::string all;
            for (const auto& [name, value] : attributes_[path]) all.append(name).push_back('\0');
            return Give(all.data(), all.size(), names, size);
        };
        hooks.getxattr = [this](const char* path, const char* name, void* value, size_t size) {
            const Bytes* const found = Find(path, name);
            if (found != nullptr) return Give(found->data(), found->size(), value, size);
            errno = ENODATA;
            return ssize_t{-1};
        };
        hooks.setxattr = [this](const char* path, const char* name, const void* value, size_t size,
                                int) {
            const auto* const bytes = static_cast<const std::uint8_t*>(value);
            SetAttribute(path, name, Bytes(bytes, bytes + size));
            return 0;
        };
        hooks.removexattr = [this](const char* path, const char* name) {
            auto& all = attributes_[path];
            if (std::erase_if(all, [&](const auto& entry) { return entry.first == name; }) == 1) {
                return 0;
            }
            errno = ENODATA;
            return -1;
        };
        hooks.archive = [this](int fd) {
            const std::string link = "/proc/self/fd/" + std::to_string(fd);
            archived.push_back(Short(std::filesystem::read_symlink(link).string()));
            return archive_result;
        };
        hooks.command = [this](const char* path, int command) {
            commands.push_back(Short(path) + " " + std::to_string(command));
            return 0;
        };
        Platform().fs_type = [this](const std::string& path, int flag) {
            if (flag != 1) return 1;  // an EA directory that has just been made
            if (path == src_) return src_type;
            if (path == dir_ / "dst") return dst_type;
            ADD_FAILURE() << "type of " << path;
            return -1;
        };
        Platform().exec = RunHere;
    }

    static ssize_t Give(const void* bytes, size_t length, void* to, size_t size) {
        if (size == 0) return static_cast<ssize_t>(length);
        if (size < length) {
            errno = ERANGE;
            return -1;
        }
        if (length != 0) memcpy(to, bytes, length);
        return static_cast<ssize_t>(length);
    }

    static inline CopyWorld* current_ = nullptr;

    // The tables build thousands of these.
    TempDir dir_{FastDirectory()};
    std::string src_ = dir_ / "src/object";
    std::string dst_ = dir_ / "dst/object";
    std::map<std::string, std::vector<std::pair<std::string, Bytes>>> attributes_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_COPY_WORLD_H_
