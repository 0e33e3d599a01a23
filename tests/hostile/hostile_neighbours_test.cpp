// What other users of a share may put where the library keeps metadata: links that lead out of the
// share, named pipes that nobody serves, folders in the place of files, files that are not ours.
// Nothing may be waited for, and nothing outside the share made, opened, changed or removed.

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// ---- What is put in the way ---------------------------------------------------------------------

enum class Kind {
    kLinkToFile,
    kLinkToFolder,
    kDanglingLink,
    kLoop,
    kFifo,
    kFolder,
    kFile,  // where a folder is expected
    kSocket,
};

constexpr Kind kAllKinds[] = {Kind::kLinkToFile, Kind::kLinkToFolder, Kind::kDanglingLink,
                              Kind::kLoop,       Kind::kFifo,         Kind::kFolder,
                              Kind::kFile,       Kind::kSocket};
constexpr Kind kLinks[] = {Kind::kLinkToFile, Kind::kLinkToFolder, Kind::kDanglingLink,
                           Kind::kLoop};

std::string NameOf(Kind kind) {
    switch (kind) {
        case Kind::kLinkToFile:
            return "link to a file outside";
        case Kind::kLinkToFolder:
            return "link to a folder outside";
        case Kind::kDanglingLink:
            return "dangling link";
        case Kind::kLoop:
            return "link to itself";
        case Kind::kFifo:
            return "named pipe";
        case Kind::kFolder:
            return "folder";
        case Kind::kFile:
            return "file";
        case Kind::kSocket:
            return "socket";
    }
    return "";
}

bool IsLink(Kind kind) {
    return kind == Kind::kLinkToFile || kind == Kind::kLinkToFolder ||
           kind == Kind::kDanglingLink || kind == Kind::kLoop;
}

// ---- The share ----------------------------------------------------------------------------------

// The object "a" is in "from", "b" in "to"; these are the paths of their metadata below the share.
constexpr char kFromDir[] = "from/@eaDir";
constexpr char kFromStream[] = "from/@eaDir/a@MavoEAStream";
constexpr char kFromResource[] = "from/@eaDir/a@MavoResource";
constexpr char kFromTemporary[] = "from/@eaDir/a@MavoResourceTmp";
constexpr char kFromDouble[] = "from/._a";
constexpr char kFromFolder[] = "from/@eaDir/a";
constexpr char kFromColor[] = "from/@eaDir/a/color";
constexpr char kFromLegacy[] = "from/@eaDir/a/MAVO:Resource";
constexpr char kFromCover[] = "from/@eaDir/.cover";
constexpr char kToDir[] = "to/@eaDir";
constexpr char kToStream[] = "to/@eaDir/b@MavoEAStream";
constexpr char kToResource[] = "to/@eaDir/b@MavoResource";
constexpr char kToDouble[] = "to/._b";
constexpr char kToFolder[] = "to/@eaDir/b";
constexpr char kToThumb[] = "to/@eaDir/b/MAVOThumb";

const std::vector<std::string> kFromPlaces = {kFromDir,    kFromStream, kFromResource,
                                              kFromDouble, kFromFolder, kFromColor,
                                              kFromLegacy, kFromCover,  kFromTemporary};
const std::vector<std::string> kAllPlaces = {
    kFromDir,   kFromStream, kFromResource, kFromDouble,    kFromFolder,
    kFromColor, kFromLegacy, kFromCover,    kFromTemporary, kToDir,
    kToStream,  kToResource, kToDouble,     kToFolder,      kToThumb};

bool IsFolderPlace(const std::string& place) {
    return place == kFromDir || place == kToDir || place == kFromFolder || place == kToFolder;
}

// Which metadata an object has: what the present version keeps, or what earlier ones kept.
enum class Layout { kCurrent, kLegacy };

Bytes SomeStream(const char* name) {
    return StreamImage{.attributes = {{name, Ascii("value")}}, .fork = Pattern(40)}.Build();
}
// A resource file that is a netatalk record too.
Bytes SomeResource() {
    Bytes bytes = PlainAppleDouble(Pattern(32), Pattern(700));
    bytes.resize(800);
    return bytes;
}

void MakeDir(const std::string& path) {
    if (mkdir(path.c_str(), 0777) != 0 || chmod(path.c_str(), 0777) != 0) abort();
}

// A directory that is none of a share's business, with names and contents that any operation would
// take for its own.
class Outside {
 public:
    Outside() {
        for (const char* dir : {"folder", "folder/a"}) MakeDir(*this / dir);
        for (const char* name :
             {"file", "folder/a@MavoEAStream", "folder/b@MavoEAStream", "folder/color"}) {
            WriteFile(*this / name, SomeStream("outside"));
        }
        for (const char* name : {"folder/a@MavoResource", "folder/b@MavoResource",
                                 "folder/MAVO:Resource", "folder/MAVOThumb", "folder/a/color"}) {
            WriteFile(*this / name, SomeResource());
        }
        WriteFile(*this / "folder/.cover", {});
        Settle();
    }

    const std::string& path() const { return dir_.path(); }
    std::string operator/(const std::string& name) const { return dir_ / name; }

    // From here on its present state is the right one.
    void Settle() {
        // Modes and times that any access would change.
        const timespec times[2] = {{.tv_sec = 1000000000, .tv_nsec = 0},
                                   {.tv_sec = 1000000000, .tv_nsec = 0}};
        for (const auto& entry : fs::recursive_directory_iterator(path())) {
            const mode_t mode = entry.is_directory() ? 0750 : 0640;
            if (chmod(entry.path().c_str(), mode) != 0) abort();
        }
        for (const auto& entry : fs::recursive_directory_iterator(path())) {
            if (utimensat(AT_FDCWD, entry.path().c_str(), times, 0) != 0) abort();
        }
        state_ = Look();
    }

    // What has changed: the state of what did, before and now.
    std::string Changes() const {
        const std::map<std::string, std::string> now = Look();
        std::string text;
        for (const auto& [name, state] : state_) {
            const auto found = now.find(name);
            if (found == now.end()) {
                text += name + " is gone\n";
            } else if (found->second != state) {
                text += name + " was " + state + " and is " + found->second + "\n";
            }
        }
        for (const auto& [name, state] : now) {
            if (!state_.contains(name)) text += name + " is new\n";
        }
        return text;
    }

 private:
    // Everything, without changing a time of access by looking.
    std::map<std::string, std::string> Look() const {
        std::map<std::string, std::string> all;
        LookInto(path(), &all);
        return all;
    }
    static void LookInto(const std::string& path, std::map<std::string, std::string>* all) {
        struct stat info;
        if (lstat(path.c_str(), &info) != 0) return;
        char state[256];
        snprintf(state, sizeof state, "inode %llu mode %o user %u, changed %lld %lld, read %lld: ",
                 static_cast<unsigned long long>(info.st_ino), static_cast<unsigned>(info.st_mode),
                 static_cast<unsigned>(info.st_uid), static_cast<long long>(info.st_mtim.tv_sec),
                 static_cast<long long>(info.st_ctim.tv_nsec),
                 static_cast<long long>(info.st_atim.tv_sec));
        std::string& text = (*all)[path] = state;
        const int flags = O_RDONLY | O_NOATIME | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
        if (S_ISDIR(info.st_mode)) {
            DIR* const dir = fdopendir(open(path.c_str(), flags | O_DIRECTORY));
            if (dir == nullptr) abort();
            while (const dirent* const entry = readdir(dir)) {
                const std::string name = entry->d_name;
                if (name != "." && name != "..") LookInto(path + "/" + name, all);
            }
            closedir(dir);
        } else if (S_ISREG(info.st_mode)) {
            const int fd = open(path.c_str(), flags);
            char bytes[2048];
            const ssize_t size = fd < 0 ? -1 : read(fd, bytes, sizeof bytes);
            if (size < 0) abort();
            text.append(bytes, static_cast<std::size_t>(size));
            close(fd);
        }
    }

    TempDir dir_{FastDirectory()};
    std::map<std::string, std::string> state_;
};

// A share with the metadata of two objects, and a directory beside it that is none of its business.
class Share : private Identity {
 public:
    explicit Share(Layout layout = Layout::kCurrent) {
        ResetKernel();
        ResetPlatform();
        for (const char* dir : {"from", "to", kFromDir, kFromFolder, kToDir, kToFolder}) {
            MakeDir(*this / dir);
        }
        WriteFile(src(), Ascii("data"));
        WriteFile(dst(), Ascii("data"));
        WriteFile(*this / "fork-a", Ascii("fork"));
        WriteFile(*this / "fork-b", {});
        if (layout == Layout::kCurrent) {
            Put(kFromStream, SomeStream("s"));
            Put(kFromResource, SomeResource());
        }
        Put(kFromDouble, SomeStream("d"));
        Put(kFromColor, Ascii("red"));
        Put(kFromLegacy, SomeResource());
        Put(kToStream, SomeStream("t"));
        Put(kToResource, SomeResource());
        Put(kToDouble, SomeStream("u"));
        Put(kToThumb, Ascii("thumb"));

        StandIn();
    }
    ~Share() {
        ResetKernel();
        ResetPlatform();
    }

    std::string operator/(const std::string& name) const { return top_ / name; }
    const Outside& outside() const { return *outside_; }
    std::string src() const { return *this / "from/a"; }
    std::string dst() const { return *this / "to/b"; }
    void Put(const std::string& place, const Bytes& bytes) const {
        WriteFile(*this / place, bytes);
    }
    void Remove(const std::string& place) const { fs::remove_all(*this / place); }
    bool Has(const std::string& place) const { return Exists(*this / place); }
    // None of what is missing.
    Bytes Contents(const std::string& place) const {
        return Has(place) ? ReadFile(*this / place) : Ascii("(missing)");
    }

    // Replaces what is at `place`.
    void PutInTheWay(const std::string& place, Kind kind) const {
        Remove(place);
        const std::string path = *this / place;
        int result = 0;
        switch (kind) {
            case Kind::kLinkToFile:
                result = symlink((outside() / "file").c_str(), path.c_str());
                break;
            case Kind::kLinkToFolder:
                result = symlink((outside() / "folder").c_str(), path.c_str());
                break;
            case Kind::kDanglingLink:
                result = symlink((outside() / "new").c_str(), path.c_str());
                break;
            case Kind::kLoop:
                result = symlink(path.c_str(), path.c_str());
                break;
            case Kind::kFifo:
                result = mkfifo(path.c_str(), 0666);
                break;
            case Kind::kFolder:
                result = mkdir(path.c_str(), 0755);
                if (result == 0) WriteFile(path + "/inside", Ascii("inside"));
                break;
            case Kind::kFile:
                WriteFile(path, SomeStream("file"));
                break;
            case Kind::kSocket:
                result = Listen(path);
                break;
        }
        if (result != 0) FAIL() << path << ": " << strerror(errno);
    }

    // What is at `place`, in a form that compares: its kind, where a link leads, its mode.
    std::string LookAt(const std::string& place) const {
        const std::string path = *this / place;
        struct stat info;
        if (lstat(path.c_str(), &info) != 0) return "nothing";
        std::string text = std::to_string(info.st_ino) + " " + std::to_string(info.st_mode) + " " +
                           std::to_string(info.st_size);
        if (S_ISLNK(info.st_mode)) text += " -> " + fs::read_symlink(path).string();
        return text;
    }

    // Fails when anything outside the share has been touched, or a mode of metadata changed by its
    // path.
    void Check() {
        EXPECT_THAT(opened_outside_, IsEmpty());
        EXPECT_THAT(handed_over_, IsEmpty());
        const std::string changes = outside_->Changes();
        EXPECT_EQ("", changes);
        if (!changes.empty()) outside_->Settle();  // told once
        for (const std::string& call : TakeCalls()) {
            if (!call.starts_with("chmod(")) continue;
            EXPECT_EQ(std::string::npos, call.find("@eaDir")) << call;
            EXPECT_EQ(std::string::npos, call.find("/._")) << call;
        }
        opened_outside_.clear();
        handed_over_.clear();
    }

    // What has been opened outside the share, by whatever path.
    const std::vector<std::string>& opened_outside() const { return opened_outside_; }

    // What there is outside all shares of a test.
    static void MakeOutside() { outside_ = std::make_unique<Outside>(); }
    static void RemoveOutside() { outside_ = nullptr; }

    // What has been done there so far was meant.
    void AllowChangesOutside() {
        opened_outside_.clear();
        outside_->Settle();
    }

    // A call of the copy's callback.
    static int CopyFn(const char* from, const char* to) { return current_->CopyOver(from, to); }

    // The external commands as they are, instead of their likes in this process.
    static void UseRealCommands() { Platform().exec = nullptr; }

 private:
    // Names of sockets have to be short.
    static int Listen(const std::string& path) {
        sockaddr_un name = {};
        name.sun_family = AF_UNIX;
        if (path.size() >= sizeof name.sun_path) return -1;
        memcpy(name.sun_path, path.c_str(), path.size());
        const int fd = socket(AF_UNIX, SOCK_STREAM, 0);
        if (fd < 0) return -1;
        const int result = bind(fd, reinterpret_cast<const sockaddr*>(&name), sizeof name);
        close(fd);
        return result;
    }

    // Programs follow links and wait for pipes: they are given neither.
    void CheckHandedOver(const std::string& path) {
        struct stat info;
        if (lstat(path.c_str(), &info) != 0 || S_ISREG(info.st_mode)) return;
        handed_over_.push_back(path);
    }

    int CopyOver(const std::string& from, const std::string& to) {
        CheckHandedOver(from);
        CheckHandedOver(to);
        std::error_code error;
        fs::copy_file(from, to, fs::copy_options::overwrite_existing, error);
        return error ? 1 : 0;
    }

    int Run(const std::vector<std::string>& argv) {
        std::error_code error;
        if (argv[0] == "/bin/cp") return CopyOver(argv[2], argv[3]);
        if (argv[0] == "/bin/mv") {
            const std::string& from = argv[argv.size() - 2];
            std::string to = argv.back();
            // A folder, a link to one too, is moved into.
            if (fs::is_directory(to, error)) to += "/" + fs::path(from).filename().string();
            fs::rename(from, to, error);
            return error ? 1 : 0;
        }
        EXPECT_EQ("/bin/rm", argv[0]);
        EXPECT_TRUE(argv.back().starts_with(top_.path())) << argv.back();
        fs::remove_all(argv.back(), error);
        return error ? 1 : 0;
    }

    // Attributes in memory, of volumes of every type; forks in files of the share.
    void StandIn() {
        current_ = this;
        BeUser(0);
        KernelHooks& hooks = Hooks();
        hooks.fsync = [](int) { return 0; };
        hooks.sync = [] {};
        hooks.archive = [](int) { return 0; };
        hooks.command = [](const char*, int) { return 0; };
        hooks.stat = [this](const char* path, struct stat* info) {
            return ::stat(Viewed(path).c_str(), info);
        };
        hooks.fopen = [this](const char* path, const char* mode) {
            return ::fopen(Viewed(path).c_str(), mode);
        };
        hooks.listxattr = [](const char*, char* names, size_t size) {
            constexpr char kNames[] = "user.x\0com.apple.FinderInfo\0com.apple.ResourceFork";
            if (size != 0) memcpy(names, kNames, sizeof kNames);
            return static_cast<ssize_t>(sizeof kNames);
        };
        hooks.getxattr = [](const char*, const char* name, void* value, size_t size) -> ssize_t {
            const std::string text = name;
            const Bytes bytes = text == "user.netatalk.Metadata" ? AttributeRecord()
                                : text == "com.apple.FinderInfo" ? Pattern(32)
                                                                 : Ascii("value");
            if (size == 0) return static_cast<ssize_t>(bytes.size());
            if (size < bytes.size()) {
                errno = ERANGE;
                return -1;
            }
            memcpy(value, bytes.data(), bytes.size());
            return static_cast<ssize_t>(bytes.size());
        };
        hooks.setxattr = [](const char*, const char*, const void*, size_t, int) { return 0; };
        hooks.removexattr = [](const char*, const char*) { return 0; };
        hooks.opened = [this](int fd) {
            const std::string link = "/proc/self/fd/" + std::to_string(fd);
            const std::string path = fs::read_symlink(link).string();
            if (path.starts_with(outside_->path())) opened_outside_.push_back(path);
        };
        Platform().exec = [this](const std::vector<std::string>& argv) { return Run(argv); };
    }

    std::string Viewed(const std::string& path) const {
        if (path == src() + "/rsrc") return *this / "fork-a";
        if (path == dst() + "/rsrc") return *this / "fork-b";
        return path;
    }

    static inline Share* current_ = nullptr;
    static inline std::unique_ptr<Outside> outside_;
    TempDir top_{FastDirectory()};
    std::vector<std::string> opened_outside_;
    std::vector<std::string> handed_over_;
};

// ---- Every operation against everything ---------------------------------------------------------

struct Operation {
    std::string name;
    std::function<int(const Share&)> run;
    bool keeps_descriptor = false;
    bool inside_folder = false;  // the legacy folder is a component of its path
    std::vector<std::string> places = kFromPlaces;
    bool legacy_too = true;
};

void Close(int fd) {
    if (fd >= 0) close(fd);
}

int Copy(const Share& share, int from, int to, int move,
         int (*copy_fn)(const char*, const char*) = nullptr, int copy_eadir = 1) {
    std::string dst = share.dst();
    return MAVOEACopyEx(share.src().c_str(), dst.data(), move, copy_eadir, from, to, 1, 1, copy_fn);
}

constexpr int kFlags[] = {O_RDONLY,           O_RDWR,
                          O_WRONLY,           O_RDONLY | O_CREAT,
                          O_RDWR | O_TRUNC,   O_RDWR | O_NONBLOCK,
                          O_RDWR | O_CREAT,   O_RDWR | O_CREAT | O_TRUNC,
                          O_RDWR | O_CLOEXEC, O_RDWR | O_CREAT | O_NOFOLLOW};

std::vector<Operation> Opens() {
    std::vector<Operation> all;
    for (const std::string kind : {"MavoEAStream", "MavoResource", "MAVO:Resource", "color"}) {
        for (const int form : {0, 1}) {
            all.push_back({.name = "open " + kind + " in form " + std::to_string(form),
                           .run =
                               [=](const Share& share) {
                                   for (const int flags : kFlags) {
                                       Close(MAVOEAOpenNoADFS(form, share.src().c_str(),
                                                              kind.c_str(), flags));
                                   }
                                   return 0;
                               },
                           .inside_folder = form == 0});
        }
    }
    for (const int place : {0, 1}) {
        all.push_back(
            {"open in place " + std::to_string(place), [=](const Share& share) {
                 for (const int flags : kFlags) {
                     Close(MAVOEAOpen(1, share.src().c_str(), "MavoEAStream", flags, place));
                 }
                 return 0;
             }});
    }
    for (const int parent_first : {0, 1}) {
        for (const int form : {0, 1}) {
            all.push_back({"mkdir, form " + std::to_string(form), [=](const Share& share) {
                               char dir[MAVOEA_PATH_SIZE];
                               EXPECT_EQ(0,
                                         MAVOEADirPath(form, share.src().c_str(), dir, sizeof dir));
                               return MAVOEAMKDir(parent_first, dir);
                           }});
        }
    }
    return all;
}

std::vector<Operation> Records() {
    static constexpr unsigned char kFinderInfo[32] = {'T', 'E', 'X', 'T'};
    const auto of_src = [](int (*function)(const char*)) {
        return [=](const Share& share) { return function(share.src().c_str()); };
    };
    return {
        {"read the record", of_src([](const char* path) {
             EAAdouble record = {};
             return MAVOEAEADirAdoubleRead(path, &record);
         })},
        {"flush the record", of_src([](const char* path) {
             const Bytes block(741);
             return MAVOEAEADirAdoubleFlush(block.data(), 741, path);
         }),
         true},
        {"read the attribute's record", of_src([](const char* path) {
             EAAdouble record = {};
             return MAVOEAFileEAAdoubleRead(path, &record);
         })},
        {"write Finder info",
         of_src([](const char* path) { return MAVOEAEADirFSFInfoWrite(path, kFinderInfo); })},
        {"sync Finder info",
         of_src([](const char* path) { return MAVOEAFileEAFSFinfoEASync(path, 0); })},
        {"stamp the flush time",
         of_src([](const char* path) { return MAVOEAFileEAWriteFlushTime(path, 0); })},
        {"check the AppleDouble file",
         [](const Share& share) { return MAVOEACheckADFile((share / kFromDouble).c_str()); }},
        {"repair", of_src(MAVOEAFixErrorAD)},
        {"get the fork", of_src([](const char* path) {
             char value[100];
             return MAVOEAXattrGet(path, "com.apple.ResourceFork", value, sizeof value);
         })},
        {"set the fork", of_src([](const char* path) {
             return MAVOEAXattrSet(path, "com.apple.ResourceFork", "new", 3, 0);
         })},
        {"remove the fork", of_src([](const char* path) {
             return MAVOEAXattrRemove(path, "com.apple.ResourceFork");
         })},
        {"set the archive bit", of_src(EASetSmbArchive)},
    };
}

std::vector<Operation> Removals() {
    std::vector<Operation> all;
    for (const int type : {0, 1, 2, 7}) {
        all.push_back({"remove from type " + std::to_string(type), [=](const Share& share) {
                           return MAVOEARemove(share.src().c_str(), type, nullptr);
                       }});
        all.push_back({.name = "rename on type " + std::to_string(type),
                       .run =
                           [=](const Share& share) {
                               return MAVOEARename(share.src().c_str(), share.dst().c_str(), type,
                                                   nullptr);
                           },
                       .places = kAllPlaces});
    }
    all.push_back({"remove without the stream", [](const Share& share) {
                       return MAVOEARemoveWithoutEAStream(share.src().c_str(), 1);
                   }});
    for (const int form : {0, 1}) {
        all.push_back({"remove form " + std::to_string(form),
                       [=](const Share& share) { return EARemove(form, share.src().c_str()); }});
    }
    all.push_back({"remove the EA directory", [](const Share& share) {
                       return EARemoveEADir((share / kFromStream).c_str());
                   }});
    all.push_back({"clean", [](const Share& share) {
                       fs::remove(share.src());
                       fs::remove_all(share / kFromDouble);
                       MAVOEARemoveDanglingEADir((share / "from").c_str());
                       return 0;
                   }});
    for (const std::string kind : {"MavoEAStream", "MavoResource", "MAVO:Resource", "MAVO:x"}) {
        all.push_back({"upgrade " + kind, [=](const Share& share) {
                           return MAVOEAUpgrade(share.src().c_str(), kind.c_str());
                       }});
    }
    return all;
}

// The places that a copy between volumes of these types may come across.
std::vector<std::string> PlacesOfCopy(int from, int to) {
    std::vector<std::string> places = {kFromDir, kFromFolder, kFromColor,
                                       kToDir,   kToFolder,   kToThumb};
    if (from == 0) places.push_back(kFromDouble);
    if (from != 0) places.push_back(kFromResource);
    if (from == 1 || from == 2) places.push_back(kFromStream);
    if (from == 1) places.insert(places.end(), {kFromDouble, kFromLegacy, kFromCover});
    if (to == 0) places.push_back(kToDouble);
    if (to != 0 && to != 7) places.insert(places.end(), {kToStream, kToResource});
    return places;
}

std::vector<Operation> Copies() {
    std::vector<Operation> all;
    const auto add = [&](const std::string& name, int from, int to, auto run) {
        all.push_back({.name = name + " from " + std::to_string(from) + " to " + std::to_string(to),
                       .run = run,
                       .keeps_descriptor = true,
                       .places = PlacesOfCopy(from, to),
                       .legacy_too = from == 1});
    };
    for (const int from : {0, 1, 2, 7}) {
        for (const int to : {0, 1, 2, 7, 12}) {
            for (const int move : {0, 1}) {
                add(move != 0 ? "move" : "copy", from, to,
                    [=](const Share& share) { return Copy(share, from, to, move); });
            }
        }
    }
    for (const int to : {0, 1, 2}) {
        add("copy by callback", 1, to,
            [=](const Share& share) { return Copy(share, 1, to, 0, Share::CopyFn); });
        add("move by callback", 1, to,
            [=](const Share& share) { return Copy(share, 1, to, 1, Share::CopyFn, 0); });
    }
    return all;
}

// Where a child process tells what it is at, for when it has to be killed.
class Progress {
 public:
    Progress()
        : text_(static_cast<char*>(
              mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0))) {
        if (text_ == MAP_FAILED) abort();
    }
    ~Progress() { munmap(text_, kSize); }
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    void Tell(const std::string& text) { snprintf(text_, kSize, "%s", text.c_str()); }
    std::string text() const { return text_; }

 private:
    static constexpr std::size_t kSize = 4096;
    char* text_;
};

class HostileNeighboursTest : public ::testing::Test {
 protected:
    HostileNeighboursTest() { Share::MakeOutside(); }
    ~HostileNeighboursTest() override { Share::RemoveOutside(); }

    static void TryOne(const Operation& operation, Layout layout, const std::string& place,
                       Kind kind) {
        Share share(layout);
        share.PutInTheWay(place, kind);
        const int live = TakeAllocations().live;
        const long descriptors = OpenDescriptors();
        const std::string directory = fs::current_path().string();
        const uid_t user = geteuid();
        (void)operation.run(share);
        EXPECT_EQ(live, TakeAllocations().live);
        if (!operation.keeps_descriptor) {
            EXPECT_EQ(descriptors, OpenDescriptors());
        }
        EXPECT_EQ(directory, fs::current_path().string());
        EXPECT_EQ(user, geteuid());
        share.Check();
        if (operation.keeps_descriptor) CloseAllIn(share);
    }

    // A flush leaves the file open, by design.
    static void CloseAllIn(const Share& share) {
        std::vector<int> open;
        std::error_code error;
        for (const auto& entry : fs::directory_iterator("/proc/self/fd")) {
            if (fs::read_symlink(entry.path(), error).string().starts_with(share / "")) {
                open.push_back(std::stoi(entry.path().filename().string()));
            }
        }
        for (const int fd : open) close(fd);
    }

    void TryAll(const std::vector<Operation>& operations) {
        Progress progress;
        int tried = 0;
        for (const Operation& operation : operations) {
            const auto each = [&](const auto& of) {
                for (const Layout layout : {Layout::kCurrent, Layout::kLegacy}) {
                    if (layout == Layout::kLegacy && !operation.legacy_too) continue;
                    for (const std::string& place : operation.places) {
                        for (const Kind kind : kAllKinds) {
                            if (!of(place, kind) || tried++ % kSeriesStep != 0) continue;
                            const std::string what =
                                operation.name + ", " + place + " is a " + NameOf(kind) +
                                (layout == Layout::kLegacy ? ", legacy layout" : "");
                            SCOPED_TRACE(what);
                            progress.Tell(what);
                            TryOne(operation, layout, place, kind);
                        }
                    }
                }
            };
            each([&](const std::string& place, Kind kind) {
                // A directory component is followed; tested below.
                const bool component = place == kFromDir || place == kToDir ||
                                       (place == kFromFolder && operation.inside_folder);
                if (component && kind == Kind::kLinkToFolder) return false;
                if (!IsFolderPlace(place) && kind == Kind::kFile) return false;
                if (IsFolderPlace(place) && kind == Kind::kFolder) return false;
                return kind != Kind::kFifo;
            });
            if (HasFailure()) return;
            WithoutWaiting(
                [&] { each([](const std::string&, Kind kind) { return kind == Kind::kFifo; }); });
            if (HasFailure()) {
                ADD_FAILURE() << "it came as far as: " << progress.text();
                return;
            }
        }
    }
};

TEST_F(HostileNeighboursTest, NoOpenTouchesWhatIsOutsideTheShareOrWaits) { TryAll(Opens()); }
TEST_F(HostileNeighboursTest, NoReadOrFlushTouchesWhatIsOutsideTheShareOrWaits) {
    TryAll(Records());
}
TEST_F(HostileNeighboursTest, NoRemovalRenameOrUpgradeTouchesWhatIsOutsideTheShareOrWaits) {
    TryAll(Removals());
}
TEST_F(HostileNeighboursTest, NoCopyTouchesWhatIsOutsideTheShareOrWaits) { TryAll(Copies()); }

// ---- Opening ------------------------------------------------------------------------------------

// The current layout's metadata files, as the open functions reach them.
struct OpenedFile {
    const char* place;
    const char* kind;
    int in;  // EA_PLACE_...
};
constexpr OpenedFile kOpenedFiles[] = {{kFromStream, "MavoEAStream", EA_PLACE_EADIR},
                                       {kFromResource, "MavoResource", EA_PLACE_EADIR},
                                       {kFromDouble, "MavoEAStream", EA_PLACE_APPLEDOUBLE}};
// What a refused open leaves: errno only, as any failure of open(2) does.
void ExpectRefused(int error, int result, int reported) {
    EXPECT_EQ(-1, result);
    EXPECT_EQ(error, reported) << strerror(reported);
    ExpectNothingReported();
}

int ErrorOf(Kind kind) {
    if (IsLink(kind)) return ELOOP;
    return kind == Kind::kFolder ? EISDIR : ENXIO;
}

class HostileFileTest : public HostileNeighboursTest {
 protected:
    // Runs `body` for each kind of what is no regular file, with a share in which that is `place`,
    // in a process that does not wait.
    static void WithEach(const std::string& place, Layout layout,
                         const std::function<void(Share&, Kind)>& body) {
        WithoutWaiting([&] {
            for (const Kind kind : kAllKinds) {
                if (kind == Kind::kFile) continue;
                SCOPED_TRACE(place + " is a " + NameOf(kind));
                Share share(layout);
                share.PutInTheWay(place, kind);
                const std::string before = share.LookAt(place);
                TakeCalls();
                body(share, kind);
                share.Check();
                if (keeps_what_is_there) {
                    EXPECT_EQ(before, share.LookAt(place));
                }
            }
        });
    }
    void TearDown() override { keeps_what_is_there = true; }

    static inline bool keeps_what_is_there = true;
};

// Promise: "MAVOEAOpen: Returns a descriptor"
TEST_F(HostileFileTest, AMetadataFileThatIsNoRegularFileIsNotOpened) {
    for (const OpenedFile& file : kOpenedFiles) {
        WithEach(file.place, Layout::kCurrent, [&](const Share& share, Kind kind) {
            for (const int flags : kFlags) {
                SCOPED_TRACE(flags);
                errno = 0;
                int fd = MAVOEAOpen(1, share.src().c_str(), file.kind, flags, file.in);
                ExpectRefused(ErrorOf(kind), fd, errno);
                if (file.in != EA_PLACE_EADIR) continue;
                fd = MAVOEAOpenNoADFS(1, share.src().c_str(), file.kind, flags);
                ExpectRefused(ErrorOf(kind), fd, errno);
            }
        });
    }
}

TEST_F(HostileFileTest, AFileOfALegacyFolderThatIsNoRegularFileIsNotOpened) {
    for (const char* place : {kFromLegacy, kFromColor}) {
        const std::string name = fs::path(place).filename().string();
        WithEach(place, Layout::kLegacy, [&](const Share& share, Kind kind) {
            for (const int flags : kFlags) {
                SCOPED_TRACE(flags);
                errno = 0;
                const int fd = MAVOEAOpen(0, share.src().c_str(), name.c_str(), flags, 0);
                ExpectRefused(ErrorOf(kind), fd, errno);
            }
        });
    }
}

TEST_F(HostileFileTest, AnExclusiveOpenFindsTheLinkThere) {
    for (const OpenedFile& file : kOpenedFiles) {
        for (const Kind kind : kLinks) {
            SCOPED_TRACE(NameOf(kind));
            Share share;
            share.PutInTheWay(file.place, kind);
            // The first try is without O_CREAT.
            EXPECT_EQ(-1, MAVOEAOpen(1, share.src().c_str(), file.kind, O_RDWR | O_CREAT | O_EXCL,
                                     file.in));
            EXPECT_TRUE(errno == ELOOP || errno == EEXIST) << strerror(errno);
            share.Check();
        }
    }
}

TEST_F(HostileFileTest, AnEADirectoryThatIsNoDirectoryIsLeftAsItIs) {
    for (const Kind kind : {Kind::kLinkToFile, Kind::kDanglingLink, Kind::kLoop, Kind::kFifo,
                            Kind::kFile, Kind::kSocket}) {
        WithoutWaiting([&] {
            SCOPED_TRACE(NameOf(kind));
            Share share;
            share.PutInTheWay(kFromDir, kind);
            const std::string before = share.LookAt(kFromDir);
            // What exists already is never looked at.
            EXPECT_EQ(0, MAVOEAMKDir(0, (share / kFromDir).c_str()));
            ExpectNothingReported();
            EXPECT_EQ(-1, MAVOEAMKDir(1, (share / kFromFolder).c_str()));
            EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x3C00, "ea_mkdir.c")));
            EXPECT_EQ(-1, MAVOEAOpen(1, share.src().c_str(), "MavoEAStream", O_RDWR | O_CREAT, 0));
            const int error = kind == Kind::kDanglingLink ? ENOENT
                              : kind == Kind::kLoop       ? ELOOP
                                                          : ENOTDIR;
            EXPECT_EQ(error, errno);
            share.Check();
            EXPECT_EQ(before, share.LookAt(kFromDir));
        });
    }
}

TEST_F(HostileFileTest, ANewEADirectoryIsOpenedToAllThroughADescriptor) {
    Share share;
    share.Remove(kFromDir);
    TakeCalls();
    EXPECT_EQ(0, MAVOEAMKDir(1, (share / kFromFolder).c_str()));
    const std::vector<std::string> calls = TakeCalls();
    EXPECT_EQ(2, std::count_if(calls.begin(), calls.end(), [](const std::string& call) {
                  return call.starts_with("fchmod(") && call.ends_with("0777)");
              }));
    EXPECT_EQ(0, std::count_if(calls.begin(), calls.end(),
                               [](const std::string& call) { return call.starts_with("chmod("); }));
    EXPECT_EQ(0777, ModeOf(share / kFromDir));
    EXPECT_EQ(0777, ModeOf(share / kFromFolder));
}

// ---- Records, Finder info, repair ---------------------------------------------------------------

TEST_F(HostileFileTest, ARecordInAFileThatIsNoRegularFileIsNeitherReadNorWritten) {
    WithEach(kFromResource, Layout::kCurrent, [](const Share& share, Kind kind) {
        const std::string reason = share.src() + "] " + strerror(ErrorOf(kind));
        EAAdouble record = {};
        EXPECT_EQ(-1, MAVOEAEADirAdoubleRead(share.src().c_str(), &record));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_eadirfs_adouble_read")));
        EXPECT_THAT(TakeLog(),
                    ElementsAre("ea_eadirfs_adouble_read:LINE Error: open path [" + reason));
        const Bytes block(741);
        EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, share.src().c_str()));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_eadirfs_flush")));
        EXPECT_THAT(TakeLog(), ElementsAre("ea_eadirfs_flush:LINE Error open path [" + reason));
    });
}

TEST_F(HostileFileTest, FinderInfoInAFileThatIsNoRegularFileIsNeitherReadNorWritten) {
    static constexpr unsigned char kFinderInfo[32] = {'T', 'E', 'X', 'T'};
    WithEach(kFromResource, Layout::kCurrent, [](const Share& share, Kind) {
        EXPECT_EQ(-1, MAVOEAEADirFSFInfoWrite(share.src().c_str(), kFinderInfo));
        TakeCalls();
        EXPECT_EQ(-1, MAVOEAFileEAFSFinfoEASync(share.src().c_str(), 0));
        for (const std::string& call : TakeCalls()) EXPECT_FALSE(call.starts_with("setxattr"));
    });
}

TEST_F(HostileFileTest, AnAppleDoubleFileThatIsNoRegularFileIsNone) {
    WithEach(kFromDouble, Layout::kCurrent, [](const Share& share, Kind) {
        EXPECT_EQ(-3, MAVOEACheckADFile((share / kFromDouble).c_str()));
        ExpectNothingReported();
    });
}

TEST_F(HostileFileTest, ACompanionMayBeAnything) {
    for (const Kind kind : kAllKinds) {
        SCOPED_TRACE(NameOf(kind));
        Share share;
        share.PutInTheWay("from/a", kind);
        WithoutWaiting([&] { EXPECT_EQ(0, MAVOEACheckADFile((share / kFromDouble).c_str())); });
        share.Check();
    }
}

TEST_F(HostileFileTest, AResourceFileThatIsNoRegularFileIsNotRepaired) {
    WithEach(kFromResource, Layout::kCurrent, [](const Share& share, Kind) {
        const Bytes stream = share.Contents(kFromStream);
        EXPECT_EQ(-1, MAVOEAFixErrorAD(share.src().c_str()));
        EXPECT_FALSE(share.Has(kFromTemporary));
        EXPECT_EQ(stream, share.Contents(kFromStream));
    });
}

TEST_F(HostileFileTest, ARepairDoesNotWriteThroughWhatIsInItsTemporaryFilesPlace) {
    keeps_what_is_there = false;
    WithEach(kFromTemporary, Layout::kCurrent, [](const Share& share, Kind kind) {
        share.Put(kFromResource, SomeStream("moved"));
        const bool folder = kind == Kind::kFolder;
        EXPECT_EQ(folder ? -1 : 0, MAVOEAFixErrorAD(share.src().c_str()));
        if (folder) {
            EXPECT_EQ(SomeStream("moved"), share.Contents(kFromResource));
            EXPECT_EQ(Ascii("inside"), share.Contents(std::string(kFromTemporary) + "/inside"));
            return;
        }
        EXPECT_FALSE(share.Has(kFromTemporary));
        EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(share / kFromResource)));
        EXPECT_EQ(PlainAppleDouble(Repeat(0, 32), Pattern(40)).size(),
                  share.Contents(kFromResource).size());
    });
}

TEST_F(HostileFileTest, ARepairDoesNotMoveAttributesIntoAStreamThatIsNoRegularFile) {
    WithEach(kFromStream, Layout::kCurrent, [](const Share& share, Kind) {
        share.Put(kFromResource, SomeStream("moved"));
        EXPECT_EQ(-1, MAVOEAFixErrorAD(share.src().c_str()));
        EXPECT_EQ(SomeStream("moved"), share.Contents(kFromResource));
        EXPECT_FALSE(share.Has(kFromTemporary));
    });
}

// ---- Upgrade ------------------------------------------------------------------------------------

TEST_F(HostileFileTest, AnAttributeFileThatIsNoRegularFileStaysWhereItIs) {
    WithEach(kFromColor, Layout::kLegacy, [](const Share& share, Kind kind) {
        share.Remove(kFromDouble);
        share.Remove(kFromLegacy);
        share.Put("from/@eaDir/a/tags", Ascii("work"));
        EXPECT_EQ(0, MAVOEAUpgrade(share.src().c_str(), "MavoEAStream"));
        // Where a link leads is looked at, but not opened.
        const int code = kind == Kind::kDanglingLink || kind == Kind::kLoop     ? 0x2A00
                         : kind == Kind::kFolder || kind == Kind::kLinkToFolder ? 0xA00
                                                                                : 0x900;
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, "ea_upgrade")));
        EXPECT_EQ((StreamImage{.attributes = {{"tags", Ascii("work")}}}.Build()),
                  share.Contents(kFromStream));
        EXPECT_FALSE(share.Has("from/@eaDir/a/tags"));
    });
}

// With nothing that the present layout could be made from but what is to be refused.
TEST_F(HostileFileTest, AnAppleDoubleFileThatIsNoRegularFileDoesNotBecomeTheStream) {
    WithEach(kFromDouble, Layout::kLegacy, [](const Share& share, Kind) {
        share.Remove(kFromFolder);
        EXPECT_EQ(2, MAVOEAUpgrade(share.src().c_str(), "MavoEAStream"));
        ExpectNothingReported();
        EXPECT_FALSE(share.Has(kFromStream));
    });
}

TEST_F(HostileFileTest, LegacyAttributesAreNotWrittenThroughALinkInTheStreamsPlace) {
    for (const Kind kind : {Kind::kDanglingLink, Kind::kLoop}) {
        SCOPED_TRACE(NameOf(kind));
        Share share(Layout::kLegacy);
        share.Remove(kFromDouble);
        share.PutInTheWay(kFromStream, kind);
        const std::string before = share.LookAt(kFromStream);
        EXPECT_EQ(-1, MAVOEAUpgrade(share.src().c_str(), "MavoEAStream"));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_upgrade")));
        EXPECT_EQ(Ascii("red"), share.Contents(kFromColor));
        EXPECT_EQ(before, share.LookAt(kFromStream));
        share.Check();
    }
}

TEST_F(HostileFileTest, ALegacyFolderThatIsALinkIsNotLookedInto) {
    for (const Kind kind :
         {Kind::kLinkToFile, Kind::kLinkToFolder, Kind::kFifo, Kind::kFile, Kind::kSocket}) {
        for (const std::string name : {"MavoEAStream", "MavoResource"}) {
            WithoutWaiting([&] {
                SCOPED_TRACE(NameOf(kind) + " " + name);
                Share share(Layout::kLegacy);
                share.Remove(kFromDouble);
                share.PutInTheWay(kFromFolder, kind);
                const std::string before = share.LookAt(kFromFolder);
                const int result = MAVOEAUpgrade(share.src().c_str(), name.c_str());
                // A stream's folder is to be removed whatever was in it.
                const bool fails = name == "MavoEAStream" || kind == Kind::kLinkToFolder;
                if (fails) {
                    EXPECT_EQ(-1, result);
                    EXPECT_EQ(1u, TakeRecords().size());
                } else {
                    EXPECT_NE(0, result);
                }
                EXPECT_FALSE(share.Has(kFromStream));
                EXPECT_FALSE(share.Has(kFromResource));
                EXPECT_EQ(before, share.LookAt(kFromFolder));
                share.Check();
            });
        }
    }
}

// The move of a legacy resource file is a rename, of whatever it is; its marks are then out of
// reach, and the object keeps its own.
TEST_F(HostileFileTest, AMovedResourceFileThatIsNoRegularFileGivesTheObjectNoMarks) {
    keeps_what_is_there = false;
    WithEach(kFromLegacy, Layout::kLegacy, [](const Share& share, Kind kind) {
        ASSERT_EQ(0, chmod(share.src().c_str(), 0604));
        const std::string before = share.LookAt(kFromLegacy);
        const int result = MAVOEAUpgrade(share.src().c_str(), "MavoResource");
        EXPECT_EQ(0604, ModeOf(share.src()));
        if (kind == Kind::kDanglingLink) {
            EXPECT_EQ(2, result);  // as far as anyone can tell there is none
            return;
        }
        if (kind == Kind::kLoop) {
            EXPECT_EQ(-1, result);  // that cannot be told
            EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_upgrade")));
            EXPECT_EQ(before, share.LookAt(kFromLegacy));
            return;
        }
        EXPECT_EQ(0, result);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_upgrade")));
        EXPECT_EQ(before, share.LookAt(kFromResource));
        EXPECT_FALSE(share.Has(kFromLegacy));
    });
}

// ---- Removing, cleaning, renaming ---------------------------------------------------------------

TEST_F(HostileFileTest, ARemovalRemovesTheLinkAndNotWhatItLeadsTo) {
    keeps_what_is_there = false;
    for (const char* place : {kFromStream, kFromResource, kFromColor, kFromLegacy}) {
        WithEach(place, Layout::kCurrent, [&](const Share& share, Kind kind) {
            const bool folder = kind == Kind::kFolder;
            EXPECT_EQ(folder ? -1 : 0, MAVOEARemove(share.src().c_str(), 1, nullptr));
            EXPECT_EQ(folder, share.Has(place));
            EXPECT_EQ(folder, share.Has(kFromDir));
        });
    }
    WithEach(kFromDouble, Layout::kCurrent, [&](const Share& share, Kind kind) {
        const bool folder = kind == Kind::kFolder;
        EXPECT_EQ(folder ? -1 : 0, MAVOEARemove(share.src().c_str(), 0, nullptr));
        EXPECT_EQ(folder, share.Has(kFromDouble));
    });
}

TEST_F(HostileFileTest, ARemovalRemovesALinkInALegacyFoldersPlace) {
    for (const Kind kind : {Kind::kLinkToFile, Kind::kLinkToFolder}) {
        SCOPED_TRACE(NameOf(kind));
        Share share;
        share.PutInTheWay(kFromFolder, kind);
        EXPECT_EQ(0, EARemove(0, share.src().c_str()));
        EXPECT_FALSE(share.Has(kFromFolder));
        share.Check();
    }
}

TEST_F(HostileFileTest, ACoverThatIsNoRegularFileKeepsItsDirectory) {
    for (const Kind kind : {Kind::kLinkToFolder, Kind::kDanglingLink, Kind::kLoop, Kind::kFifo,
                            Kind::kFolder, Kind::kSocket}) {
        WithoutWaiting([&] {
            SCOPED_TRACE(NameOf(kind));
            Share share;
            for (const char* place : {kFromStream, kFromResource, kFromFolder}) share.Remove(place);
            share.PutInTheWay(kFromCover, kind);
            EXPECT_EQ(-1, EARemoveEADir((share / kFromStream).c_str()));
            EXPECT_TRUE(share.Has(kFromCover));
            share.Check();
        });
    }
}

TEST_F(HostileFileTest, AnEADirectoryThatIsALinkIsNotRemovedThroughTheLink) {
    for (const Kind kind : {Kind::kLinkToFolder, Kind::kLinkToFile, Kind::kLoop}) {
        SCOPED_TRACE(NameOf(kind));
        Share share;
        // All that is where the link leads is a cover.
        fs::remove_all((share.outside() / "folder"));
        ASSERT_EQ(0, mkdir((share.outside() / "folder").c_str(), 0777));
        WriteFile((share.outside() / "folder/.cover"), {});
        share.AllowChangesOutside();
        share.PutInTheWay(kFromDir, kind);
        EXPECT_EQ(-1, EARemoveEADir((share / kFromStream).c_str()));
        EXPECT_TRUE(share.Has(kFromDir));
        const std::vector<std::string> log = TakeLog();
        ASSERT_EQ(1u, log.size());
        EXPECT_TRUE(log[0].starts_with("ea_remove:LINE Failed to opendir ")) << log[0];
        share.Check();
    }
}

TEST_F(HostileFileTest, CleaningRemovesALinkInTheEADirectorysPlaceAndNothingBehindIt) {
    for (const Kind kind : kAllKinds) {
        WithoutWaiting([&] {
            SCOPED_TRACE(NameOf(kind));
            Share share;
            share.PutInTheWay(kFromDir, kind);
            share.Remove(kFromDouble);
            share.Remove("from/a");
            Share::UseRealCommands();
            MAVOEARemoveDanglingEADir((share / "from").c_str());
            EXPECT_FALSE(share.Has(kFromDir));
            share.Check();
        });
    }
}

TEST_F(HostileFileTest, ARenameMovesTheLinkItself) {
    struct Ends {
        const char* from;
        const char* to;
    };
    for (const Ends& ends : {Ends{kFromStream, kToStream}, Ends{kFromResource, kToResource},
                             Ends{kFromFolder, kToFolder}}) {
        for (const Kind kind : {Kind::kLinkToFile, Kind::kLinkToFolder, Kind::kFifo}) {
            WithoutWaiting([&] {
                const std::string from = ends.from;
                const std::string to = ends.to;
                SCOPED_TRACE(from + " is a " + NameOf(kind));
                Share share;
                share.PutInTheWay(from, kind);
                const std::string before = share.LookAt(from);
                EXPECT_EQ(0, MAVOEARename(share.src().c_str(), share.dst().c_str(), 1, nullptr));
                EXPECT_EQ(before, share.LookAt(to));
                EXPECT_FALSE(share.Has(from));
                share.Check();
            });
        }
    }
}

TEST_F(HostileFileTest, ARenameReplacesALinkAtItsTarget) {
    for (const auto& [from, to] :
         {std::pair{kFromStream, kToStream}, std::pair{kFromResource, kToResource},
          std::pair{kFromFolder, kToFolder}}) {
        for (const Kind kind : kLinks) {
            // No directory can be renamed over what is none.
            const bool folder = std::string(from) == kFromFolder;
            if (folder && (kind == Kind::kDanglingLink || kind == Kind::kLoop)) continue;
            SCOPED_TRACE(std::string(to) + " is a " + NameOf(kind));
            Share share;
            share.PutInTheWay(to, kind);
            const std::string before = share.LookAt(from);
            EXPECT_EQ(0, MAVOEARename(share.src().c_str(), share.dst().c_str(), 1, nullptr));
            EXPECT_EQ(before, share.LookAt(to));
            share.Check();
        }
    }
}

TEST_F(HostileFileTest, ARenameAcrossVolumesDoesNotMoveIntoAFolderAtItsTarget) {
    for (const char* place : {kToStream, kToResource}) {
        for (const Kind kind : {Kind::kLinkToFolder, Kind::kFolder}) {
            SCOPED_TRACE(std::string(place) + " is a " + NameOf(kind));
            Share share;
            share.PutInTheWay(place, kind);
            const std::string before = share.LookAt(place);
            {
                const FailCall fault("rename", EXDEV, 0);
                EXPECT_EQ(-1, MAVOEARename(share.src().c_str(), share.dst().c_str(), 1, nullptr));
            }
            EXPECT_EQ(before, share.LookAt(place));
            share.Check();
        }
    }
}

TEST_F(HostileFileTest, ARenameAcrossVolumesDoesNotMoveThroughALinkInTheFoldersPlace) {
    Share share;
    share.PutInTheWay(kToFolder, Kind::kLinkToFolder);
    {
        const FailCall fault("rename", EXDEV, 0);
        EXPECT_EQ(0, MAVOEARename(share.src().c_str(), share.dst().c_str(), 1, nullptr));
    }
    EXPECT_TRUE(fs::is_directory(fs::symlink_status(share / kToFolder)));
    share.Check();
}

TEST_F(HostileFileTest, ARenameOnAnAppleDoubleVolumeReplacesWhatIsAtItsTarget) {
    for (const Kind kind : kAllKinds) {
        WithoutWaiting([&] {
            SCOPED_TRACE(NameOf(kind));
            Share share;
            share.PutInTheWay(kToDouble, kind);
            const std::string before = share.LookAt(kFromDouble);
            EXPECT_EQ(0, MAVOEARename(share.src().c_str(), share.dst().c_str(), 0, nullptr));
            const bool stays = kind == Kind::kFolder;  // it is not empty
            EXPECT_EQ(before, share.LookAt(stays ? kFromDouble : kToDouble));
            share.Check();
        });
    }
}

// ---- Copying ------------------------------------------------------------------------------------

// What copies of each pair of types make of a link to a good file, or of a pipe, where they meet a
// metadata file. All leave it as it is.
struct CopyCase {
    int from;
    int to;
    const char* place;
    int result;
};
constexpr CopyCase kCopyCases[] = {
    {0, 0, kFromDouble, -1},   {0, 0, kToDouble, -1},     {0, 1, kFromDouble, -1},
    {0, 1, kToResource, -1},   {0, 1, kToStream, -1},     {0, 2, kFromDouble, -1},
    {0, 2, kToResource, -1},   {0, 2, kToStream, -1},     {0, 7, kFromDouble, -1},
    {1, 0, kFromResource, -2}, {1, 0, kToDouble, -2},     {1, 0, kFromStream, -1},
    {1, 1, kFromResource, -1}, {1, 1, kFromStream, -1},   {1, 1, kToResource, -1},
    {1, 1, kToStream, -1},     {1, 2, kFromResource, -1}, {1, 2, kFromStream, -1},
    {1, 2, kToResource, -1},   {1, 2, kToStream, -1},     {1, 7, kFromResource, -1},
    {1, 7, kFromStream, -1},   {1, 12, kToStream, -1},    {2, 0, kFromResource, -1},
    {2, 0, kFromStream, -1},   {2, 1, kFromResource, -1}, {2, 1, kFromStream, -1},
    {2, 1, kToStream, -1},     {2, 2, kFromStream, -1},   {2, 2, kToResource, -1},
    {2, 7, kFromResource, -1}, {2, 7, kFromStream, -1},   {7, 0, kToDouble, -1},
    {7, 1, kToResource, -1},   {7, 1, kToStream, -1},     {7, 2, kToResource, -1},
    {7, 2, kToStream, -1},
};

void TryCopy(const CopyCase& c, Kind kind) {
    for (const int move : {0, 1}) {
        SCOPED_TRACE(std::to_string(c.from) + " to " + std::to_string(c.to) + ", " + c.place +
                     " is a " + NameOf(kind) + (move != 0 ? ", move" : ""));
        Share share;
        share.PutInTheWay(c.place, kind);
        const std::string before = share.LookAt(c.place);
        EXPECT_EQ(c.result, Copy(share, c.from, c.to, move));
        EXPECT_EQ(before, share.LookAt(c.place));
        share.Check();
    }
}

TEST_F(HostileFileTest, ACopyThatMeetsALinkFailsAndLeavesIt) {
    for (const CopyCase& c : kCopyCases) TryCopy(c, Kind::kLinkToFile);
}

TEST_F(HostileFileTest, ACopyThatMeetsANamedPipeFailsAndLeavesIt) {
    for (const CopyCase& c : kCopyCases) {
        WithoutWaiting([&] { TryCopy(c, Kind::kFifo); });
        if (HasFailure()) FAIL() << c.from << " to " << c.to << ", " << c.place;
    }
}

// Making the directory takes longer than a look.
TEST_F(HostileFileTest, ALinkThatIsPutInTheWayWhileTheEADirectoryIsMadeIsNotFollowed) {
    for (const char* place : {kFromResource, kToResource}) {
        SCOPED_TRACE(place);
        Share share;
        share.Remove("to/@eaDir");
        std::string before;
        Hooks().before = [&](const std::string& name) {
            if (name != "fchmod" || !before.empty()) return;
            share.PutInTheWay(place, Kind::kLinkToFile);
            before = share.LookAt(place);
        };
        EXPECT_EQ(-1, Copy(share, 1, 1, 0));
        Hooks().before = nullptr;
        EXPECT_EQ(before, share.LookAt(place));
        share.Check();
    }
}

// Attributes go into the file of the name as it is, the rest into that of the name made safe.
TEST_F(HostileFileTest, AttributesAreNotWrittenThroughALinkUnderAnUnsafeName) {
    for (const Kind kind : kLinks) {
        SCOPED_TRACE(NameOf(kind));
        Share share;
        share.PutInTheWay(kToDouble, kind);
        const std::string before = share.LookAt(kToDouble);
        Platform().fat_replace = [](const std::string& path) { return path + "_"; };
        EXPECT_EQ(-1, Copy(share, 1, 0, 0));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_copy.c")));
        EXPECT_EQ(before, share.LookAt(kToDouble));
        EXPECT_TRUE(share.Has("to/._b_"));
        share.Check();
    }
}

TEST_F(HostileFileTest, TheCommandsAreNotGivenALinkOrAPipe) {
    WithoutWaiting([] {
        for (const auto& [from, to, place] :
             {std::tuple{0, 0, kFromDouble}, std::tuple{0, 0, kToDouble},
              std::tuple{1, 1, kFromStream}, std::tuple{1, 1, kToStream},
              std::tuple{1, 1, kFromResource}, std::tuple{1, 1, kToResource},
              std::tuple{1, 2, kFromStream}}) {
            for (const Kind kind : {Kind::kLinkToFile, Kind::kDanglingLink, Kind::kFifo}) {
                SCOPED_TRACE(std::string(place) + " is a " + NameOf(kind));
                Share share;
                // Nothing that an upgrade could put in the place of what leads nowhere.
                if (from != 0) share.Remove(kFromDouble);
                share.Remove(kFromFolder);
                share.PutInTheWay(place, kind);
                const std::string before = share.LookAt(place);
                Share::UseRealCommands();
                (void)Copy(share, from, to, 0);
                EXPECT_EQ(before, share.LookAt(place));
                share.Check();
            }
        }
    });
}

TEST_F(HostileFileTest, ALegacyFolderThatIsALinkIsNotCarriedOver) {
    for (const int move : {0, 1}) {
        Share share;
        share.PutInTheWay(kFromFolder, Kind::kLinkToFolder);
        EXPECT_EQ(0, Copy(share, 1, 1, move));
        EXPECT_EQ(Ascii("thumb"), share.Contents(kToThumb));
        share.Check();
    }
}

TEST_F(HostileFileTest, ALinkInTheDestinationFoldersPlaceIsReplacedByAFolder) {
    for (const Kind kind : {Kind::kLinkToFile, Kind::kLinkToFolder, Kind::kFifo, Kind::kSocket}) {
        for (const bool real : {false, true}) {
            WithoutWaiting([&] {
                SCOPED_TRACE(NameOf(kind));
                Share share;
                share.PutInTheWay(kToFolder, kind);
                if (real) Share::UseRealCommands();
                EXPECT_EQ(0, Copy(share, 1, 1, 0));
                EXPECT_EQ(Ascii("red"), share.Contents(std::string(kToFolder) + "/color"));
                share.Check();
            });
        }
    }
}

TEST_F(HostileFileTest, OnlyRegularFilesOfALegacyFolderAreCarriedOver) {
    for (const Kind kind : kAllKinds) {
        if (kind == Kind::kFile) continue;
        for (const int move : {0, 1}) {
            WithoutWaiting([&] {
                SCOPED_TRACE(NameOf(kind));
                Share share;
                share.PutInTheWay(kFromColor, kind);
                EXPECT_EQ(0, Copy(share, 1, 1, move));
                EXPECT_THAT(NamesIn(share / kToFolder), ElementsAre("MAVO:Resource"));
                EXPECT_EQ(move == 0, share.Has(kFromFolder));
                share.Check();
            });
        }
    }
}

TEST_F(HostileFileTest, CopiedFilesAreOpenedToAllThroughDescriptors) {
    Share share;
    for (const auto& [from, to] : {std::pair{1, 1}, std::pair{0, 1}, std::pair{1, 0},
                                   std::pair{7, 1}, std::pair{1, 2}, std::pair{2, 1}}) {
        SCOPED_TRACE(std::to_string(from) + " to " + std::to_string(to));
        for (const char* place : {kToStream, kToResource, kToDouble, kToFolder}) {
            share.Remove(place);
        }
        TakeCalls();
        EXPECT_EQ(0, Copy(share, from, to, 0));
        const std::vector<std::string> calls = TakeCalls();
        EXPECT_NE(0, std::count_if(calls.begin(), calls.end(), [](const std::string& call) {
                      return call.starts_with("fchmod(") && call.ends_with("0777)");
                  }));
        for (const std::string& call : calls) {
            if (!call.starts_with("chmod(")) continue;
            const std::string path = call.substr(6, call.rfind(", ") - 6);
            EXPECT_TRUE(path == share.src() || path == share.dst()) << call;
        }
    }
    CloseAllIn(share);
}

// ---- Other owners -------------------------------------------------------------------------------

class OtherOwnerTest : public HostileNeighboursTest {
 protected:
    static constexpr uid_t kUser = 54321;

    void SetUp() override { MAVOEA_SKIP_WITHOUT_OTHER_USERS(); }
};

TEST_F(OtherOwnerTest, AFileOfAnotherUserIsNotOpenedAndKeepsItsMode) {
    for (const mode_t mode : {0u, 0600u}) {
        Share share;
        for (const OpenedFile& file : kOpenedFiles) {
            ASSERT_EQ(0, chmod((share / file.place).c_str(), mode));
        }
        AsUser(kUser, Root::kSaved, [&] {
            Hooks().geteuid = nullptr;
            Hooks().seteuid = nullptr;
            for (const OpenedFile& file : kOpenedFiles) {
                for (const int flags : {O_RDONLY, O_RDWR, O_RDWR | O_CREAT | O_TRUNC}) {
                    errno = 0;
                    const int fd = MAVOEAOpen(1, share.src().c_str(), file.kind, flags, file.in);
                    ExpectRefused(EACCES, fd, errno);
                }
            }
            EXPECT_EQ(-3, MAVOEACheckADFile((share / kFromDouble).c_str()));
            EXPECT_EQ(-1, MAVOEAFixErrorAD(share.src().c_str()));
            EAAdouble record = {};
            EXPECT_EQ(-1, MAVOEAEADirAdoubleRead(share.src().c_str(), &record));
            const Bytes block(741);
            EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, share.src().c_str()));
            (void)Copy(share, 1, 1, 0);
            EXPECT_EQ(kUser, geteuid());
        });
        for (const OpenedFile& file : kOpenedFiles) {
            EXPECT_EQ(static_cast<int>(mode), ModeOf(share / file.place));
        }
        share.Check();
    }
}

TEST_F(OtherOwnerTest, AnEADirectoryOfAnotherUserKeepsItsMode) {
    Share share;
    ASSERT_EQ(0, chmod((share / kFromDir).c_str(), 0700));
    AsUser(kUser, Root::kSaved, [&] {
        Hooks().geteuid = nullptr;
        Hooks().seteuid = nullptr;
        EXPECT_EQ(0, MAVOEAMKDir(0, (share / kFromDir).c_str()));
        EXPECT_EQ(-1, MAVOEAOpen(1, share.src().c_str(), "MavoEAStream", O_RDWR | O_CREAT, 0));
        EXPECT_EQ(EACCES, errno);
        EXPECT_NE(0, MAVOEARemove(share.src().c_str(), 1, nullptr));
        // Neither resource file nor stream can be looked for; both may be there.
        EXPECT_EQ(-2, MAVOEARename(share.src().c_str(), share.dst().c_str(), 1, nullptr));
    });
    EXPECT_EQ(0700, ModeOf(share / kFromDir));
    EXPECT_TRUE(share.Has(kFromStream));
    share.Check();
}

TEST_F(OtherOwnerTest, ALinkThatAnotherUserMadeIsNotFollowedByTheSuperuser) {
    for (const OpenedFile& file : kOpenedFiles) {
        Share share;
        share.PutInTheWay(file.place, Kind::kLinkToFile);
        ASSERT_EQ(0, lchown((share / file.place).c_str(), kUser, kUser));
        errno = 0;
        const int fd =
            MAVOEAOpen(1, share.src().c_str(), file.kind, O_RDWR | O_CREAT | O_TRUNC, file.in);
        ExpectRefused(ELOOP, fd, errno);
        share.Check();
    }
}

// ---- What follows links by its nature -----------------------------------------------------------

TEST_F(HostileNeighboursTest, AnEADirectoryThatIsALinkToADirectoryIsFollowedAsAnyComponentIs) {
    Share share;
    share.PutInTheWay(kFromDir, Kind::kLinkToFolder);
    const int fd = MAVOEAOpen(1, share.src().c_str(), "MavoEAStream", O_RDONLY, 0);
    ASSERT_LE(0, fd);
    close(fd);
    EXPECT_THAT(share.opened_outside(), ElementsAre((share.outside() / "folder/a@MavoEAStream")));
    share.AllowChangesOutside();
    EXPECT_EQ(0, MAVOEARemove(share.src().c_str(), 1, nullptr));
    EXPECT_FALSE(Exists((share.outside() / "folder/a@MavoEAStream")));
    EXPECT_FALSE(Exists((share.outside() / "folder/a@MavoResource")));
    EXPECT_TRUE(Exists((share.outside() / "folder/b@MavoEAStream")));
    EXPECT_TRUE(share.Has(kFromDir));
}

TEST_F(HostileNeighboursTest, ALegacyFolderThatIsALinkIsFollowedByAnOpenInTheLegacyForm) {
    Share share;
    share.PutInTheWay(kFromFolder, Kind::kLinkToFolder);
    const int fd = MAVOEAOpen(0, share.src().c_str(), "MAVO:Resource", O_RDONLY, 0);
    ASSERT_LE(0, fd);
    close(fd);
    EXPECT_THAT(share.opened_outside(), ElementsAre((share.outside() / "folder/MAVO:Resource")));
}

// But what it leads to is no more opened to all than any directory that was there before.
TEST_F(HostileNeighboursTest, WhatAnEADirectoryThatIsALinkLeadsToKeepsItsMode) {
    Share share;
    share.PutInTheWay(kFromDir, Kind::kLinkToFolder);
    EXPECT_EQ(0, MAVOEAMKDir(0, (share / kFromDir).c_str()));
    EXPECT_EQ(0, MAVOEAMKDir(1, (share / kFromFolder).c_str()));
    share.Check();
}

TEST_F(HostileNeighboursTest, TheAttributesAndModeOfAnObjectThatIsALinkAreThoseOfItsTarget) {
    Share share(Layout::kLegacy);
    ASSERT_EQ(0, rename(share.src().c_str(), (share / "from/target").c_str()));
    ASSERT_EQ(0, symlink("target", share.src().c_str()));
    ASSERT_EQ(0, chmod((share / "from/target").c_str(), 0600));
    Bytes resource =
        Hex("00 05 16 07  00 02 00 00  00*16  00 01 "
            "00 00 00 0E  00 00 00 26  00 00 00 04  00 00 00 20");  // no writing
    share.Put(kFromLegacy, resource);
    EXPECT_EQ(0, MAVOEAUpgrade(share.src().c_str(), "MavoResource"));
    EXPECT_EQ(0400, ModeOf(share / "from/target"));
    share.Check();
}

TEST_F(HostileNeighboursTest, AnObjectThatIsANamedPipeKeepsNobodyWaiting) {
    WithoutWaiting([] {
        Share share;
        share.PutInTheWay("from/a", Kind::kFifo);
        share.PutInTheWay("to/b", Kind::kFifo);
        const std::string object = share.src();
        char value[10];
        (void)EASetSmbArchive(object.c_str());
        (void)MAVOEAXattrGet(object.c_str(), "com.apple.ResourceFork", value, sizeof value);
        (void)MAVOEAXattrSet(object.c_str(), "com.apple.ResourceFork", value, 1, 0);
        (void)MAVOEAXattrRemove(object.c_str(), "com.apple.ResourceFork");
        for (const int from : {0, 1, 2, 7}) {
            for (const int to : {0, 1, 2, 7}) (void)Copy(share, from, to, 0);
        }
        EXPECT_EQ(0, MAVOEARename(object.c_str(), share.dst().c_str(), 1, nullptr));
        EXPECT_EQ(0, MAVOEARemove(share.dst().c_str(), 1, nullptr));
        share.Check();
    });
}

TEST_F(HostileNeighboursTest, TheNameTestsLookAtNamesOnly) {
    Share share;
    TakeCallNames();
    for (const char* place : {kFromDir, kFromStream, kFromDouble, kToDir}) {
        share.PutInTheWay(place, Kind::kLinkToFolder);
        const std::string path = share / place;
        (void)MAVOEAIsHiddenDir(path.c_str());
        (void)MAVOEAIsHiddenDirName(path.c_str());
        (void)MAVOEAIsVetoFile(path.c_str());
        (void)MAVOEAIsHiddenFile(path.c_str());
        (void)MAVOEAIsHiddenName(path.c_str());
        char buffer[MAVOEA_PATH_SIZE];
        for (const int in : {0, 1}) {
            EXPECT_EQ(0, MAVOEAPath(1, path.c_str(), "MavoEAStream", buffer, sizeof buffer, in));
        }
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

}  // namespace
}  // namespace mavoea::test
