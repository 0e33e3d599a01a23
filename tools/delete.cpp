#include "tools/delete.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "tools/carry.h"
#include "tools/directory.h"
#include "tools/text.h"
#include "tools/transfer.h"

namespace mavoea::tool {
namespace {

struct stat StatusOf(const std::string& path) {
    struct stat info;
    if (::lstat(path.c_str(), &info) != 0) throw SystemFailure(path, errno);
    return info;
}

// Data first: without it, metadata is of no use to anybody.
void DeleteFile(const Object& object) {
    if (::unlink(object.path.c_str()) != 0) throw SystemFailure(object.path, errno);
    RemoveMetadata(object, IndexReport::kYes);
}

bool IsEaDirectory(const Directory::Entry& entry) {
    return S_ISDIR(entry.type) && entry.name == "@eaDir";
}

bool IsAppleDouble(const Directory::Entry& entry) {
    return S_ISREG(entry.type) && entry.name.starts_with("._");
}

enum class Orphans { kKeep, kDelete };

// A directory in which no object is left. Its EA directory describes nothing any more.
void DeleteEmptyDirectory(const Object& object, Orphans orphans) {
    {
        const Directory directory = Directory::Open(object.path);
        const auto entries = directory.Entries();
        for (const Directory::Entry& entry : entries) {
            if (IsEaDirectory(entry) || (orphans == Orphans::kDelete && IsAppleDouble(entry))) {
                continue;
            }
            if (!IsAppleDouble(entry)) throw SystemFailure(object.path, ENOTEMPTY);
            throw Failure(kFailed, directory.PathOf(entry.name),
                          "it is metadata of no object, and has not been moved",
                          "move or remove it with its directory");
        }
        for (const Directory::Entry& entry : entries) (void)directory.Remove(entry.name);
    }
    if (::rmdir(object.path.c_str()) != 0) throw SystemFailure(object.path, errno);
    RemoveMetadata(object, IndexReport::kYes);
}

// As deep as paths can be: each level takes a '/' and a letter of 4096 bytes.
void DeleteTree(const Object& object, Orphans orphans) {
    if (!S_ISDIR(StatusOf(object.path).st_mode)) return DeleteFile(object);
    const auto entries = Directory::Open(object.path).Entries();
    for (const Directory::Entry& entry : entries) {
        if (IsEaDirectory(entry) || IsAppleDouble(entry)) continue;
        DeleteTree(FindObject(object.path + '/' + entry.name), orphans);
    }
    DeleteEmptyDirectory(object, orphans);
}

class Deletion {
 public:
    explicit Deletion(const JobOptions& options)
        : options_(options), job_("removing", "removed", options) {}

    ExitStatus Run() {
        for (const std::string& path : options_.paths) {
            if (job_.stopped()) break;
            Guard(path, [&] { DeleteNamed(path); });
        }
        return job_.Finish();
    }

 private:
    template <class Work>
    void Guard(const std::string& path, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            const bool gone = failure.status() == kNotFound && !Exists(path);
            if (gone && options_.consent == Consent::kForce) return;
            job_.AddFailure(path, failure);
        }
    }

    void DeleteNamed(const std::string& path) {
        const std::string last = std::filesystem::path(path).filename().string();
        if (last == "." || last == "..") {
            throw Failure(kFailed, path, "the directories \".\" and \"..\" are not removed",
                          "name it from the directory above it");
        }
        const Object object = FindObject(path);
        const struct stat info = StatusOf(object.path);
        const struct stat root = StatusOf("/");
        if (info.st_dev == root.st_dev && info.st_ino == root.st_ino) {
            throw Failure(kFailed, path, "the root is not removed", "name something below it");
        }
        if (S_ISDIR(info.st_mode) && !options_.recursive) {
            throw Failure(kFailed, path, "it is a directory", "use -r");
        }
        DeleteObject(object, info);
    }

    void DeleteObject(const Object& object, const struct stat& info) {
        const bool ask = options_.consent == Consent::kAsk;
        if (!S_ISDIR(info.st_mode)) {
            const std::string what = std::string("remove ") + NameOfType(info.st_mode) + ' ';
            if (!job_.MayBeLost(object.path, what + Quoted(object.path) + '?')) return Skip();
            if (job_.stopped()) return;
            DeleteFile(object);
            job_.AddDone(object.path, "removed " + Quoted(object.path));
            return;
        }
        const auto entries = Directory::Open(object.path).Entries();
        if (ask && !entries.empty() &&
            !job_.Ask("descend into directory " + Quoted(object.path) + '?')) {
            return Skip();
        }
        const std::uint64_t left = job_.failures() + job_.skipped();
        for (const Directory::Entry& entry : entries) {
            if (job_.stopped()) return;
            if (IsEaDirectory(entry) || IsAppleDouble(entry)) continue;
            const std::string path = object.path + '/' + entry.name;
            Guard(path, [&] { DeleteObject(FindObject(path), StatusOf(path)); });
        }
        if (job_.stopped() || job_.failures() + job_.skipped() > left) return;
        if (ask && !job_.Ask("remove directory " + Quoted(object.path) + '?')) return Skip();
        if (job_.stopped()) return;
        DeleteEmptyDirectory(object, Orphans::kDelete);
        job_.AddDone(object.path, "removed directory " + Quoted(object.path));
    }

    void Skip() {
        if (!job_.stopped()) job_.AddSkipped();
    }

    const JobOptions& options_;
    Job job_;
};

}  // namespace

ExitStatus Delete(const JobOptions& options) { return Deletion(options).Run(); }

void DeleteMoved(const std::string& path) { DeleteTree(FindObject(path), Orphans::kKeep); }

}  // namespace mavoea::tool
