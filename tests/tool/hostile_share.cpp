#include "tests/tool/hostile_share.h"

#include <fcntl.h>
#include <grp.h>
#include <stdio.h>
#include <sys/fsuid.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>

#include "tests/support/mac_files.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

constexpr char kAttic[] = "attic";
constexpr char kSecret[] = "SECRET";
constexpr char kFileOutside[] = "file";  // where links lead has to tell no secret

[[noreturn]] void Die(const std::string& what, const std::string& path) {
    perror((what + ' ' + path).c_str());
    abort();
}

// Where the share is: where that is quickest, if files there keep all that they should.
std::string Place() {
    const std::string fast = FastDirectory();
    return KeepsUserAttributes(fast) ? fast : fs::temp_directory_path().string();
}

// ---- Files --------------------------------------------------------------------------------------

// With the rights and for the owner that the process has for files.
struct Maker {
    std::string text;  // is in everything that can hold it
    mode_t directory_mode;
    mode_t file_mode;

    void Directory(const std::string& path) const {
        if (mkdir(path.c_str(), directory_mode) != 0 && errno != EEXIST) Die("mkdir", path);
    }
    void File(const std::string& path, const Bytes& bytes) const {
        const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL, file_mode);
        if (fd < 0 || write(fd, bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size())) {
            Die("write", path);
        }
        close(fd);
    }
    void Attribute(const std::string& path, const char* name, const Bytes& value) const {
        if (setxattr(path.c_str(), name, value.data(), value.size(), 0) != 0) {
            Die("setxattr", path);
        }
    }

    Bytes Text(const std::string& of) const { return Ascii(text + ' ' + of); }
    Bytes FinderInfo() const {
        Bytes info = Text("type and creator");
        info.resize(32, ' ');
        info[8] = 0;  // the flags
        return info;
    }
    Bytes Stream() const {
        return StreamImage{.attributes = {{"user.colour", Text("colour")}},
                           .fork = Text("fork"),
                           .finder_info = FinderInfo()}
            .Build();
    }
    Bytes Resource(bool misplaced) const {
        return misplaced ? Stream() : ClassicFile(FinderInfo(), Text("fork")).bytes;
    }
    // It makes its object read-only.
    Bytes LegacyResource() const {
        Bytes file = OneEntry(14, 400, 4, 741);
        PutU16(file, 24, 3);
        const std::uint32_t entries[] = {9, 450, 32, 2, 741, 10};
        for (std::size_t i = 0; i < 6; ++i) PutU32(file, 38 + 4 * i, entries[i]);
        PutU16(file, 402, 0x0020);
        const Bytes info = FinderInfo();
        std::copy(info.begin(), info.end(), file.begin() + 450);
        Bytes fork = Text("fork");
        fork.resize(10);
        return file + fork;
    }
    // Data and Finder info.
    Bytes Single() const {
        Bytes file = AppleDoubleOf({{1, Text("data in")}, {kFinderInfoEntry, FinderInfo()}});
        PutU32(file, 0, 0x00051600);
        return file;
    }
    Bytes Record() const {
        Bytes record = AttributeRecord();
        const Bytes info = FinderInfo();
        std::copy(info.begin(), info.end(), record.begin() + 122);
        return record;
    }
};

// A file or a directory that is there already.
void AddMetadata(const Maker& maker, unsigned parts, const std::string& parent,
                 const std::string& name) {
    if ((parts & kAppleDoubleFiles) != 0) maker.File(parent + "/._" + name, maker.Stream());
    if ((parts & kEaFiles) == 0) return;
    const std::string in_ea_dir = parent + "/@eaDir/" + name;
    maker.Directory(parent + "/@eaDir");
    maker.File(in_ea_dir + "@MavoEAStream", maker.Stream());
    if (name == "sub" || name == "tree") return;
    maker.File(in_ea_dir + "@MavoResource", maker.Resource((parts & kMisplaced) != 0));
}

void AddLegacyFolder(const Maker& maker, const std::string& parent, const std::string& name) {
    const std::string folder = parent + "/@eaDir/" + name;
    maker.Directory(parent + "/@eaDir");
    maker.Directory(folder);
    maker.File(folder + "/user.colour", maker.Text("colour"));
    maker.File(folder + "/MAVO:Resource", maker.LegacyResource());
}

// As restore takes it, with something for each place.
std::string TextForTree() {
    std::string text;
    for (const char* path : {"tree", "tree/a.txt", "tree/b.txt", "tree/sub", "tree/sub/d.txt"}) {
        text += std::string("# file: ") + path +
                "\nuser.user.colour=\"new\"\nuser.com.apple.ResourceFork=\"new fork\"\n"
                "user.mavoea.comment=\"remark\"\nuser.mavoea.hidden=\"1\"\n"
                "user.mavoea.service.@Other=\"new\"\nuser.mavoea.service./MAVO:Other=\"new\"\n"
                "user.mavoea.locked=\"1\"\n\n";
    }
    return text;
}

void MakeTree(const Maker& maker, unsigned parts, int type, const std::string& parent) {
    const std::string tree = parent + "/tree";
    const std::string sub = tree + "/sub";
    maker.Directory(tree);
    maker.Directory(sub);
    for (const char* name : {"/a.txt", "/b.txt", "/c.txt", "/sub/d.txt"}) {
        maker.File(tree + name, maker.Text("data"));
    }
    for (const std::string& path : {tree + "/a.txt", sub + "/d.txt"}) {
        maker.Attribute(path, "user.colour", maker.Text("colour"));
        if (type == 2) maker.Attribute(path, "user.netatalk.Metadata", maker.Record());
        if ((parts & kLocked) != 0 && chmod(path.c_str(), 0444) != 0) Die("chmod", path);
    }
    AddMetadata(maker, parts, parent, "tree");
    AddMetadata(maker, parts, tree, "a.txt");
    AddMetadata(maker, parts, tree, "sub");
    AddMetadata(maker, parts, sub, "d.txt");
    if ((parts & kEaFiles) != 0) {
        AddLegacyFolder(maker, tree, "b.txt");
        maker.File(tree + "/@eaDir/a.txt@Thumbnail", maker.Text("thumbnail"));
    }
    maker.File(tree + "/._c.txt", maker.Stream());
    if ((parts & kWithoutObject) != 0) {
        AddMetadata(maker, kEaFiles, sub, "gone");
        AddLegacyFolder(maker, tree, "gone");
        maker.File(tree + "/._gone", maker.Stream());
    }
    if ((parts & kIncoming) != 0) {
        maker.File(tree + "/incoming",
                   ClassicFile(maker.FinderInfo(), maker.Text("fork in")).bytes);
    }
    if ((parts & kText) != 0) maker.File(parent + "/text", Ascii(TextForTree()));
    if ((parts & kSingle) != 0) maker.File(tree + "/single", maker.Single());
    if ((parts & kArchived) != 0) {
        const std::string folder = tree + "/__MACOSX";
        maker.Directory(folder);
        maker.Directory(folder + "/sub");
        maker.File(folder + "/._a.txt", maker.Stream());
        maker.File(folder + "/._c.txt", maker.Stream());
        maker.File(folder + "/sub/._d.txt", maker.Stream());
    }
}

// A tree of all parts, in each of its directories one name more than there is on the share.
void MakeSecretTree(const std::string& parent) {
    const Maker maker = {kSecret, 0700, 0600};
    MakeTree(maker, kAllParts | kArchived | kSingle, 2, parent);
    const std::string tree = parent + "/tree";
    for (const std::string& directory :
         {parent, parent + "/@eaDir", tree, tree + "/@eaDir", tree + "/@eaDir/b.txt", tree + "/sub",
          tree + "/sub/@eaDir"}) {
        maker.File(directory + '/' + kSecret, maker.Stream());
    }
}

// ---- Looking ------------------------------------------------------------------------------------

std::string TextFromDescriptor(int fd) {
    std::string text;
    char part[4096];
    for (ssize_t size; (size = read(fd, part, sizeof part)) > 0;) {
        text.append(part, static_cast<std::size_t>(size));
    }
    return text;
}

// Their names and values; of a link its own.
std::string AttributesOf(const std::string& path) {
    char names[4096];
    const ssize_t size = llistxattr(path.c_str(), names, sizeof names);
    std::vector<std::string> all;
    for (const char* name = names; name < names + std::max<ssize_t>(size, 0);
         name += std::string_view(name).size() + 1) {
        char value[4096];
        const ssize_t length = lgetxattr(path.c_str(), name, value, sizeof value);
        all.push_back(std::string(name) + '=' +
                      std::string(value, static_cast<std::size_t>(std::max<ssize_t>(length, 0))));
    }
    std::sort(all.begin(), all.end());
    std::string text;
    for (const std::string& attribute : all) text += attribute + '\n';
    return text;
}

std::string ContentsOf(const std::string& path, mode_t type) {
    if (S_ISLNK(type)) return fs::read_symlink(path).string();
    if (!S_ISREG(type)) return {};
    const int fd = open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK);
    if (fd < 0) return "cannot be read";
    const std::string text = TextFromDescriptor(fd);
    close(fd);
    return text;
}

std::string TimeText(const timespec& time) {
    return std::to_string(time.tv_sec) + '.' + std::to_string(time.tv_nsec);
}

std::string Description(const std::string& path) {
    struct stat info;
    if (lstat(path.c_str(), &info) != 0) return "is gone";
    char mode[16];
    snprintf(mode, sizeof mode, "%o", static_cast<unsigned>(info.st_mode));
    return std::string("mode ") + mode + ", owner " + std::to_string(info.st_uid) + ':' +
           std::to_string(info.st_gid) + ", inode " + std::to_string(info.st_ino) + ", links " +
           std::to_string(info.st_nlink) + ", changed " + TimeText(info.st_mtim) + ' ' +
           TimeText(info.st_ctim) + ", attributes " + AttributesOf(path) + ", contents " +
           ContentsOf(path, info.st_mode);
}

bool IsIn(const std::string& path, const std::string& directory) {
    return path == directory || path.starts_with(directory + '/');
}

std::string Printable(const std::string& text) {
    std::string printable;
    for (const char c : text) printable += c >= ' ' && c <= '~' ? c : '.';
    return printable;
}

}  // namespace

AsAttacker::AsAttacker() {
    setfsgid(kAttackersGroup);
    setfsuid(kAttacker);
}

AsAttacker::~AsAttacker() {
    setfsuid(geteuid());
    setfsgid(getegid());
}

Descriptions DescribeTree(const std::string& directory) {
    Descriptions all;
    all[directory] = Description(directory);
    for (const auto& entry : fs::recursive_directory_iterator(directory)) {
        all[entry.path().string()] = Description(entry.path().string());
    }
    return all;
}

std::string ChangesBetween(const Descriptions& before, const Descriptions& after) {
    std::string text;
    for (const auto& [path, was] : before) {
        const auto now = after.find(path);
        if (now == after.end()) {
            text += path + " is gone\n";
        } else if (now->second != was) {
            text += path + " was:\n    " + Printable(was) + "\n  and is:\n    " +
                    Printable(now->second) + '\n';
        }
    }
    for (const auto& [path, is] : after) {
        if (!before.contains(path)) text += path + " is new: " + Printable(is) + '\n';
    }
    return text;
}

HostileShare::HostileShare(int from_type, int to_type, unsigned parts, bool two_volumes)
    : dir_(Place()),
      root_(dir_.path()),
      from_(dir_ / "from"),
      to_(dir_ / "to"),
      outside_(dir_ / "outside"),
      from_type_(from_type),
      to_type_(to_type),
      parts_(parts) {
    if (two_volumes) {
        second_.emplace();
        if (second_->ok()) to_ = second_->path() + "/to";
    }
    // No group of the superuser's is to help the attacker.
    if (setgroups(0, nullptr) != 0) Die("setgroups", root_);
    const Umask none(0);
    if (chmod(root_.c_str(), 0755) != 0) Die("chmod", root_);
    for (const std::string& directory : {from_, to_, from_ + '/' + kAttic, to_ + '/' + kAttic}) {
        if (mkdir(directory.c_str(), 0777) != 0) Die("mkdir", directory);
        if (chown(directory.c_str(), kAttacker, kAttackersGroup) != 0) Die("chown", directory);
    }
    MakeSecrets();
}

Arguments HostileShare::WithVolumes(Arguments arguments) const {
    arguments.insert(arguments.begin(), {"--volume", from_ + '=' + std::to_string(from_type_),
                                         "--volume", to_ + '=' + std::to_string(to_type_)});
    return arguments;
}

void HostileShare::Renew() {
    for (const std::string& volume : {from_, to_}) {
        for (const std::string& name : NamesIn(volume)) {
            if (name != kAttic) fs::remove_all(volume + '/' + name);
        }
        for (const std::string& name : NamesIn(volume + '/' + kAttic)) {
            if (name.starts_with("moved")) fs::remove_all(volume + '/' + kAttic + '/' + name);
        }
    }
    const Umask none(0);
    const AsAttacker attacker;
    MakeTree({"public", 0777, 0644}, parts_, from_type_, from_);
    if ((parts_ & kThere) != 0) MakeTree({"older", 0777, 0644}, parts_, to_type_, to_);
}

void HostileShare::MakeSecrets() {
    const Umask none(0);
    fs::remove_all(outside_);
    const Maker maker = {kSecret, 0700, 0600};
    maker.Directory(outside_);
    MakeSecretTree(outside_);
    maker.File(outside_ + '/' + kFileOutside, maker.Stream());
    for (const std::string& volume : {from_, to_}) {
        // A directory that is moved here finds in ".." the names that it had beside it.
        const std::string attic = volume + '/' + kAttic;
        for (const std::string& name : NamesIn(attic)) fs::remove_all(attic + '/' + name);
        MakeSecretTree(attic);
        fs::remove_all(attic + "/@eaDir");
        for (const std::string& name : NamesIn(attic + "/tree")) {
            fs::rename(attic + "/tree/" + name, attic + '/' + name);
        }
        fs::remove(attic + "/tree");
    }
    secrets_ = DescribeSecrets();
}

Descriptions HostileShare::DescribeSecrets() const {
    Descriptions all = DescribeTree(outside_);
    for (const std::string& volume : {from_, to_}) {
        // The attacker himself changes the attic.
        const std::string attic = volume + '/' + kAttic;
        for (const std::string& name : NamesIn(attic)) {
            if (name.starts_with("moved")) continue;
            if (fs::is_directory(fs::symlink_status(attic + '/' + name))) {
                all.merge(DescribeTree(attic + '/' + name));
            } else {
                all[attic + '/' + name] = Description(attic + '/' + name);
            }
        }
    }
    return all;
}

std::vector<std::string> HostileShare::Entries() const {
    std::vector<std::string> all;
    for (const std::string& volume : {from_, to_}) {
        for (auto at = fs::recursive_directory_iterator(volume);
             at != fs::recursive_directory_iterator(); ++at) {
            const std::string path = at->path().string();
            if (!IsIn(path, volume + '/' + kAttic) || IsIn(path, Moved(path))) {
                all.push_back(path);
            } else if (at.depth() == 1) {
                at.disable_recursion_pending();
            }
        }
    }
    std::sort(all.begin(), all.end());
    return all;
}

bool HostileShare::IsOnIt(const std::string& path) const {
    const std::string volume = VolumeOf(path);
    return !volume.empty() && path != volume && !IsIn(path, volume + '/' + kAttic);
}

Descriptions HostileShare::DescribeVolumes() const {
    Descriptions all;
    for (const std::string& path : Entries()) all[path] = Description(path);
    return all;
}

std::string HostileShare::VolumeOf(const std::string& path) const {
    for (const std::string& volume : {from_, to_}) {
        if (IsIn(path, volume)) return volume;
    }
    return {};
}

std::string HostileShare::Twin(const std::string& path, bool directory) const {
    const std::string twin = outside_ + path.substr(VolumeOf(path).size());
    if (Exists(twin)) return twin;
    return directory ? outside_ + "/tree/sub" : outside_ + '/' + kFileOutside;
}

bool HostileShare::Swap(const std::string& path, const std::string& target) const {
    const AsAttacker attacker;
    (void)rename(path.c_str(), Moved(path).c_str());
    return symlink(target.c_str(), path.c_str()) == 0;
}

void HostileShare::SwapBack(const std::string& path) const {
    const AsAttacker attacker;
    struct stat info;
    if (lstat(path.c_str(), &info) != 0 || !S_ISLNK(info.st_mode)) return;
    if (unlink(path.c_str()) == 0) (void)rename(Moved(path).c_str(), path.c_str());
}

void HostileShare::ChangeAttributes(bool go) const {
    const std::vector<std::string> entries = Entries();  // he cannot see all of them
    const AsAttacker attacker;
    for (const std::string& path : entries) {
        if (go) {
            for (const char* name : {"user.colour", "user.netatalk.Metadata"}) {
                (void)lremovexattr(path.c_str(), name);
            }
        } else {
            const std::string name = "user." + std::string(200, 'n');
            (void)lsetxattr(path.c_str(), name.c_str(), name.data(), name.size(), 0);
            (void)lsetxattr(path.c_str(), "user.colour", name.data(), name.size(), 0);
        }
    }
}

std::string HostileShare::PrepareLink(const std::string& path, int number) const {
    const std::string twin = Twin(path);  // which he cannot even see
    const AsAttacker attacker;
    const std::string link = Moved(path) + std::to_string(number);
    if (symlink(twin.c_str(), link.c_str()) != 0) Die("symlink", link);
    return link;
}

std::string HostileShare::Damage(const ToolResult& result) {
    std::string damage;
    const Descriptions now = DescribeSecrets();
    if (now != secrets_) {
        damage = ChangesBetween(secrets_, now);
        MakeSecrets();
    }
    for (const auto& [path, description] : DescribeVolumes()) {
        if (path.find(kSecret) != std::string::npos ||
            description.find(kSecret) != std::string::npos) {
            damage += path + " has a secret: " + Printable(description) + '\n';
        }
    }
    for (const std::string& said : {result.out, result.err}) {
        if (said.find(kSecret) != std::string::npos) damage += "it says: " + said;
    }
    return damage;
}

std::string WhyNoAttacker() {
    if (geteuid() != 0) return "leading the superuser astray takes one; run this test as it";
    if (!OthersReach(Place()).value_or(false)) {
        return "there is no other user who can work in " + Place();
    }
    return KeepsUserAttributes(Place())
               ? std::string()
               : "files in " + Place() + " keep no extended attributes of users";
}

}  // namespace mavoea::test
