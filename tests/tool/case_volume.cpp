// A FUSE server: another directory, in which each name is looked for without regard to case.

#include "tests/tool/case_volume.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <linux/fuse.h>
#include <signal.h>
#include <stdio.h>
#include <string.h>
#include <strings.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/sysmacros.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <map>
#include <vector>

namespace mavoea::test {
namespace {

constexpr std::uint32_t kMaxWrite = 128 << 10;

// What the kernel asks, part by part. Nobody but the kernel asks, so parts are there.
class Request {
 public:
    explicit Request(const char* bytes) : at_(bytes) { header_ = Take<fuse_in_header>(); }

    const fuse_in_header& header() const { return header_; }
    template <class T>
    T Take() {
        T part;
        memcpy(&part, at_, sizeof part);
        at_ += sizeof part;
        return part;
    }
    std::string Text() {
        const std::string text = at_;
        at_ += text.size() + 1;
        return text;
    }
    const char* rest() const { return at_; }

 private:
    const char* at_;
    fuse_in_header header_;
};

class Server {
 public:
    Server(int device, int root, HardLinks hard_links) : device_(device), hard_links_(hard_links) {
        nodes_[FUSE_ROOT_ID] = {root, 1};
    }

    void Run() {
        std::vector<char> buffer(kMaxWrite + 8192);
        for (;;) {
            const ssize_t size = read(device_, buffer.data(), buffer.size());
            if (size < 0 && errno == ENODEV) return;  // unmounted
            if (size <= 0) continue;
            Request request(buffer.data());
            answer_.clear();
            const int result = Do(request);
            if (result != kNoAnswer) Answer(request.header().unique, result);
        }
    }

 private:
    static constexpr int kNoAnswer = -2;

    struct Node {
        int fd = -1;  // O_PATH: as long as it is open no other file gets the inode's number
        std::uint64_t lookups = 0;
    };
    struct Listed {
        std::string name;
        std::uint64_t inode;
        std::uint32_t type;
    };

    void Answer(std::uint64_t unique, int error) {
        if (error != 0) answer_.clear();
        fuse_out_header header = {};
        header.len = static_cast<std::uint32_t>(sizeof header + answer_.size());
        header.error = -error;
        header.unique = unique;
        answer_.insert(0, reinterpret_cast<const char*>(&header), sizeof header);
        // It fails when whoever asked is gone.
        if (write(device_, answer_.data(), answer_.size()) < 0) return;
    }
    template <class T>
    int Say(const T& part) {
        answer_.append(reinterpret_cast<const char*>(&part), sizeof part);
        return 0;
    }

    int Fd(std::uint64_t node) { return nodes_[node].fd; }
    std::string PathOf(std::uint64_t node) { return "/proc/self/fd/" + std::to_string(Fd(node)); }
    static int ErrorOf(int result) { return result < 0 ? errno : 0; }

    static std::vector<Listed> List(int directory) {
        std::vector<Listed> list;
        const int fd = openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
        DIR* const stream = fd < 0 ? nullptr : fdopendir(fd);
        if (stream == nullptr) return list;
        while (const dirent* entry = readdir(stream)) {
            list.push_back({entry->d_name, entry->d_ino, entry->d_type});
        }
        closedir(stream);
        return list;
    }

    // The name as it is kept; as it was asked for when there is none.
    static std::string Kept(int directory, const std::string& name) {
        for (const Listed& entry : List(directory)) {
            if (strcasecmp(entry.name.c_str(), name.c_str()) == 0) return entry.name;
        }
        return name;
    }

    static fuse_attr Attributes(const struct stat& status) {
        fuse_attr attributes = {};
        attributes.ino = status.st_ino;
        attributes.size = static_cast<std::uint64_t>(status.st_size);
        attributes.blocks = static_cast<std::uint64_t>(status.st_blocks);
        attributes.atime = static_cast<std::uint64_t>(status.st_atim.tv_sec);
        attributes.mtime = static_cast<std::uint64_t>(status.st_mtim.tv_sec);
        attributes.ctime = static_cast<std::uint64_t>(status.st_ctim.tv_sec);
        attributes.atimensec = static_cast<std::uint32_t>(status.st_atim.tv_nsec);
        attributes.mtimensec = static_cast<std::uint32_t>(status.st_mtim.tv_nsec);
        attributes.ctimensec = static_cast<std::uint32_t>(status.st_ctim.tv_nsec);
        attributes.mode = status.st_mode;
        attributes.nlink = static_cast<std::uint32_t>(status.st_nlink);
        attributes.uid = status.st_uid;
        attributes.gid = status.st_gid;
        attributes.rdev =
            static_cast<std::uint32_t>(major(status.st_rdev) << 8 | minor(status.st_rdev));
        attributes.blksize = static_cast<std::uint32_t>(status.st_blksize);
        return attributes;
    }

    // Nothing is kept by the kernel: what one spelling did is seen under every other at once.
    int SayAttributes(std::uint64_t node) {
        struct stat status;
        if (fstat(Fd(node), &status) != 0) return errno;
        fuse_attr_out out = {};
        out.attr = Attributes(status);
        return Say(out);
    }
    int SayEntry(int directory, const std::string& name) {
        const int fd = openat(directory, name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC);
        struct stat status;
        if (fd < 0 || fstat(fd, &status) != 0) return errno;
        Node& node = nodes_[status.st_ino];
        if (node.lookups++ == 0) {
            node.fd = fd;
        } else {
            close(fd);
        }
        fuse_entry_out out = {};
        out.nodeid = status.st_ino;
        out.attr = Attributes(status);
        return Say(out);
    }
    void Forget(std::uint64_t id, std::uint64_t lookups) {
        Node& node = nodes_[id];
        node.lookups -= lookups;
        if (node.lookups != 0) return;
        close(node.fd);
        nodes_.erase(id);
    }

    // What has just been made belongs to who asked for it.
    int SayNew(const fuse_in_header& asked, const std::string& name) {
        const int directory = Fd(asked.nodeid);
        if (fchownat(directory, name.c_str(), asked.uid, asked.gid, AT_SYMLINK_NOFOLLOW) != 0) {
            return errno;
        }
        return SayEntry(directory, name);
    }

    int SetAttributes(std::uint64_t node, const fuse_setattr_in& in) {
        const std::string path = PathOf(node);
        const uid_t user = in.valid & FATTR_UID ? in.uid : static_cast<uid_t>(-1);
        const gid_t group = in.valid & FATTR_GID ? in.gid : static_cast<gid_t>(-1);
        if ((in.valid & (FATTR_UID | FATTR_GID)) != 0 &&
            fchownat(Fd(node), "", user, group, AT_EMPTY_PATH) != 0) {
            return errno;
        }
        if ((in.valid & FATTR_MODE) != 0 && chmod(path.c_str(), in.mode & 07777) != 0) return errno;
        if ((in.valid & FATTR_SIZE) != 0 &&
            truncate(path.c_str(), static_cast<off_t>(in.size)) != 0) {
            return errno;
        }
        if ((in.valid & (FATTR_ATIME | FATTR_MTIME)) != 0) {
            const auto time = [&](std::uint32_t given, std::uint32_t now, std::uint64_t seconds,
                                  std::uint32_t nanoseconds) {
                timespec result = {static_cast<time_t>(seconds), static_cast<long>(nanoseconds)};
                if ((in.valid & given) == 0) result.tv_nsec = UTIME_OMIT;
                if ((in.valid & now) != 0) result.tv_nsec = UTIME_NOW;
                return result;
            };
            const timespec times[2] = {time(FATTR_ATIME, FATTR_ATIME_NOW, in.atime, in.atimensec),
                                       time(FATTR_MTIME, FATTR_MTIME_NOW, in.mtime, in.mtimensec)};
            if (utimensat(Fd(node), "", times, AT_EMPTY_PATH) != 0) return errno;
        }
        return SayAttributes(node);
    }

    int Rename(int from, const std::string& old_name, int to, const std::string& new_name,
               unsigned flags) {
        // What is overwritten lends its spelling.
        return ErrorOf(
            renameat2(from, Kept(from, old_name).c_str(), to, Kept(to, new_name).c_str(), flags));
    }

    int Open(const std::string& path, std::uint32_t flags) {
        const int fd =
            open(path.c_str(), (static_cast<int>(flags) & ~(O_NOFOLLOW | O_APPEND)) | O_CLOEXEC);
        return fd < 0 ? errno : SayOpened(fd);
    }
    int SayOpened(int fd) {
        fuse_open_out out = {};
        out.fh = static_cast<std::uint64_t>(fd);
        return Say(out);
    }

    int ReadDirectory(std::uint64_t node, const fuse_read_in& in) {
        std::vector<Listed>& list = listings_[in.fh];
        if (in.offset == 0) list = List(Fd(node));
        for (std::size_t i = in.offset; i < list.size(); ++i) {
            fuse_dirent entry = {};
            entry.ino = list[i].inode;
            entry.off = i + 1;
            entry.namelen = static_cast<std::uint32_t>(list[i].name.size());
            entry.type = list[i].type;
            const std::size_t size = FUSE_DIRENT_ALIGN(FUSE_NAME_OFFSET + list[i].name.size());
            if (answer_.size() + size > in.size) break;
            const std::size_t begin = answer_.size();
            answer_.append(reinterpret_cast<const char*>(&entry), FUSE_NAME_OFFSET);
            answer_ += list[i].name;
            answer_.resize(begin + size);
        }
        return 0;
    }

    // `get` is getxattr() or listxattr() into a buffer; of size 0 it asks for the size.
    template <class Get>
    int SayAttribute(std::uint32_t size, const Get& get) {
        std::string value(size, '\0');
        const ssize_t result = get(value.data(), value.size());
        if (result < 0) return errno;
        if (size != 0) {
            answer_.assign(value, 0, static_cast<std::size_t>(result));
            return 0;
        }
        fuse_getxattr_out out = {};
        out.size = static_cast<std::uint32_t>(result);
        return Say(out);
    }

    // 0, an error, or kNoAnswer. What is not here is answered with ENOSYS: the kernel goes on
    // without it.
    int Do(Request& request) {
        const fuse_in_header& asked = request.header();
        const std::uint64_t node = asked.nodeid;
        switch (asked.opcode) {
            case FUSE_INIT: {
                fuse_init_out out = {};
                out.major = FUSE_KERNEL_VERSION;
                out.minor = 31;
                out.max_readahead = request.Take<fuse_init_in>().max_readahead;
                out.flags = FUSE_BIG_WRITES;
                out.max_background = 16;
                out.max_write = kMaxWrite;
                out.time_gran = 1;
                return Say(out);
            }
            case FUSE_LOOKUP:
                return SayEntry(Fd(node), Kept(Fd(node), request.Text()));
            case FUSE_FORGET:
                Forget(node, request.Take<fuse_forget_in>().nlookup);
                return kNoAnswer;
            case FUSE_BATCH_FORGET:
                for (auto left = request.Take<fuse_batch_forget_in>().count; left > 0; --left) {
                    const auto one = request.Take<fuse_forget_one>();
                    Forget(one.nodeid, one.nlookup);
                }
                return kNoAnswer;
            case FUSE_INTERRUPT:
                return kNoAnswer;
            case FUSE_GETATTR:
                return SayAttributes(node);
            case FUSE_SETATTR:
                return SetAttributes(node, request.Take<fuse_setattr_in>());
            case FUSE_READLINK: {
                char target[PATH_MAX];
                const ssize_t size = readlinkat(Fd(node), "", target, sizeof target);
                if (size < 0) return errno;
                answer_.assign(target, static_cast<std::size_t>(size));
                return 0;
            }
            case FUSE_SYMLINK: {
                const std::string name = request.Text();
                if (symlinkat(request.Text().c_str(), Fd(node), name.c_str()) != 0) return errno;
                return SayNew(asked, name);
            }
            case FUSE_MKNOD: {
                const auto in = request.Take<fuse_mknod_in>();
                const std::string name = request.Text();
                if (mknodat(Fd(node), name.c_str(), in.mode, in.rdev) != 0) return errno;
                return SayNew(asked, name);
            }
            case FUSE_MKDIR: {
                const auto in = request.Take<fuse_mkdir_in>();
                const std::string name = request.Text();
                if (mkdirat(Fd(node), name.c_str(), in.mode) != 0) return errno;
                return SayNew(asked, name);
            }
            case FUSE_LINK: {
                const auto in = request.Take<fuse_link_in>();
                const std::string name = request.Text();
                if (hard_links_ == HardLinks::kNone) return EPERM;
                if (linkat(AT_FDCWD, PathOf(in.oldnodeid).c_str(), Fd(node), name.c_str(),
                           AT_SYMLINK_FOLLOW) != 0) {
                    return errno;
                }
                return SayEntry(Fd(node), name);
            }
            case FUSE_UNLINK:
                return ErrorOf(unlinkat(Fd(node), Kept(Fd(node), request.Text()).c_str(), 0));
            case FUSE_RMDIR:
                return ErrorOf(
                    unlinkat(Fd(node), Kept(Fd(node), request.Text()).c_str(), AT_REMOVEDIR));
            case FUSE_RENAME: {
                const auto in = request.Take<fuse_rename_in>();
                const std::string name = request.Text();
                return Rename(Fd(node), name, Fd(in.newdir), request.Text(), 0);
            }
            case FUSE_RENAME2: {
                const auto in = request.Take<fuse_rename2_in>();
                const std::string name = request.Text();
                return Rename(Fd(node), name, Fd(in.newdir), request.Text(), in.flags);
            }
            case FUSE_OPEN:
                return Open(PathOf(node), request.Take<fuse_open_in>().flags);
            case FUSE_CREATE: {
                const auto in = request.Take<fuse_create_in>();
                const std::string name = request.Text();
                const int fd = openat(
                    Fd(node), name.c_str(),
                    static_cast<int>(in.flags & ~unsigned{O_APPEND}) | O_CREAT | O_EXCL | O_CLOEXEC,
                    in.mode);
                if (fd < 0) return errno;
                const int error = SayNew(asked, name);
                return error != 0 ? error : SayOpened(fd);
            }
            case FUSE_READ: {
                const auto in = request.Take<fuse_read_in>();
                answer_.resize(in.size);
                const ssize_t size = pread(static_cast<int>(in.fh), answer_.data(), in.size,
                                           static_cast<off_t>(in.offset));
                if (size < 0) return errno;
                answer_.resize(static_cast<std::size_t>(size));
                return 0;
            }
            case FUSE_WRITE: {
                const auto in = request.Take<fuse_write_in>();
                const ssize_t size = pwrite(static_cast<int>(in.fh), request.rest(), in.size,
                                            static_cast<off_t>(in.offset));
                if (size < 0) return errno;
                fuse_write_out out = {};
                out.size = static_cast<std::uint32_t>(size);
                return Say(out);
            }
            case FUSE_RELEASE:
                close(static_cast<int>(request.Take<fuse_release_in>().fh));
                return 0;
            case FUSE_FLUSH:
            case FUSE_FSYNC:
            case FUSE_FSYNCDIR:
                return 0;
            case FUSE_OPENDIR:
                return SayOpened(++last_listing_);
            case FUSE_READDIR:
                return ReadDirectory(node, request.Take<fuse_read_in>());
            case FUSE_RELEASEDIR:
                listings_.erase(request.Take<fuse_release_in>().fh);
                return 0;
            case FUSE_STATFS: {
                struct statvfs status;
                if (fstatvfs(Fd(node), &status) != 0) return errno;
                fuse_statfs_out out = {};
                out.st.blocks = status.f_blocks;
                out.st.bfree = status.f_bfree;
                out.st.bavail = status.f_bavail;
                out.st.files = status.f_files;
                out.st.ffree = status.f_ffree;
                out.st.bsize = static_cast<std::uint32_t>(status.f_bsize);
                out.st.namelen = NAME_MAX;
                out.st.frsize = static_cast<std::uint32_t>(status.f_frsize);
                return Say(out);
            }
            case FUSE_SETXATTR: {
                // Without FUSE_SETXATTR_EXT the kernel sends the first two members only.
                const auto size = request.Take<std::uint32_t>();
                const auto flags = request.Take<std::uint32_t>();
                const std::string name = request.Text();
                return ErrorOf(setxattr(PathOf(node).c_str(), name.c_str(), request.rest(), size,
                                        static_cast<int>(flags)));
            }
            case FUSE_GETXATTR: {
                const auto in = request.Take<fuse_getxattr_in>();
                const std::string name = request.Text();
                return SayAttribute(in.size, [&](char* value, std::size_t size) {
                    return getxattr(PathOf(node).c_str(), name.c_str(), value, size);
                });
            }
            case FUSE_LISTXATTR:
                return SayAttribute(request.Take<fuse_getxattr_in>().size,
                                    [&](char* value, std::size_t size) {
                                        return listxattr(PathOf(node).c_str(), value, size);
                                    });
            case FUSE_REMOVEXATTR:
                return ErrorOf(removexattr(PathOf(node).c_str(), request.Text().c_str()));
            default:
                return ENOSYS;
        }
    }

    const int device_;
    const HardLinks hard_links_;
    std::string answer_;
    std::map<std::uint64_t, Node> nodes_;  // by inode number, but for the root
    std::map<std::uint64_t, std::vector<Listed>> listings_;
    int last_listing_ = 0;
};

}  // namespace

CaseVolume::CaseVolume(HardLinks hard_links) {
    const std::string kept = point_ / "kept";
    if (!room_.ok() || mkdir(kept.c_str(), 0755) != 0 || mkdir(path_.c_str(), 0755) != 0) return;
    const int device = open("/dev/fuse", O_RDWR | O_CLOEXEC);
    if (device < 0) return;
    const std::string options =
        "fd=" + std::to_string(device) +
        ",rootmode=40000,user_id=0,group_id=0,default_permissions,allow_other";
    if (mount("none", path_.c_str(), "fuse", 0, options.c_str()) == 0) {
        fflush(nullptr);
        server_ = fork();
        if (server_ == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            umask(0);
            Server(device, open(kept.c_str(), O_PATH | O_CLOEXEC), hard_links).Run();
            _exit(0);
        }
        if (server_ < 0) umount2(path_.c_str(), MNT_DETACH);
    }
    close(device);
}

CaseVolume::~CaseVolume() {
    if (!ok()) return;
    umount2(path_.c_str(), MNT_DETACH);
    kill(server_, SIGKILL);
    waitpid(server_, nullptr, 0);
}

}  // namespace mavoea::test
