#include "tools/move/unfinished.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "tools/place/dry_run.h"
#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "util/fnv.h"

namespace mavoea::tool {
namespace {

ByteView AsBytes(const std::string& text) {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

Place FileFor(const Place& to) {
    constexpr int kDigits = 16;
    // The name of the copy may be too long to be a part of another one.
    const std::string hash = HexNumber(Fnv::Of(to.name), kDigits).substr(2);
    return {to.directory, std::string(kMovingPrefix) + hash};
}

constexpr const char* kRemoving = "removing\n";

std::string TextFor(const struct stat& source) {
    return std::to_string(source.st_dev) + ' ' + std::to_string(source.st_ino) + '\n';
}

// Anybody may write such a file; only the mover's own counts.
std::shared_ptr<const File> FindOwn(const Place& to) {
    const Place place = FileFor(to);
    auto file = place.directory->FindFile(place.name, O_RDONLY);
    return file && file->Status().st_uid == ::geteuid() ? file : nullptr;
}

std::string TextIn(const File& file) {
    constexpr std::size_t kMost = 256;
    const Bytes bytes = file.Read(0, kMost);
    return {bytes.begin(), bytes.end()};
}

}  // namespace

UnfinishedMove::UnfinishedMove(const Place& to, const struct stat& source) : to_(to) {
    if (Find(to, source)) return;
    if (DryRun()) {
        const int error = WhyNoNewFile(*to.directory);
        if (error != 0) throw SystemFailure(FileFor(to).path(), error);
        return;
    }
    Forget();  // another move, which has no more to say
    TemporaryFile file(FileFor(to));
    file.file().Write(0, AsBytes(TextFor(source)));
    file.GiveToNewTarget();
}

void UnfinishedMove::BeginRemoval() const {
    if (DryRun()) return;
    const Place place = FileFor(to_);
    const auto file = place.directory->FindFile(place.name, O_RDWR);
    if (!file) throw SystemFailure(place.path(), ENOENT);
    const std::string text = TextIn(*file);
    if (!text.ends_with(kRemoving)) file->Write(text.size(), AsBytes(kRemoving));
}

void UnfinishedMove::Forget(const Place& to) {
    if (!DryRun()) (void)to.directory->RemoveFile(FileFor(to).name);
}

bool UnfinishedMove::Find(const Place& to, const struct stat& source) {
    const auto file = FindOwn(to);
    return file && TextIn(*file).starts_with(TextFor(source));
}

std::optional<timespec> UnfinishedMove::RemovalBegan(const Place& to) {
    const auto file = FindOwn(to);
    if (!file || !TextIn(*file).ends_with(kRemoving)) return std::nullopt;
    return file->Status().st_mtim;
}

void RemoveLeftMetadata(const DirectoryRef& inside, const Directory& made, const timespec& began) {
    const std::string prefix = AppleDoubleName({});
    const auto has_gone = [&](const std::string& name) {
        return !name.empty() && !inside->Has(name) && made.Has(name);
    };
    const auto consider = [&](const Sidecars::Found& found, const std::string& object) {
        const bool left = IsBefore(found.info.st_ctim, began) && has_gone(object);
        if (left) (void)found.directory->RemoveFile(found.name);
    };
    for (const Directory::Entry& entry : inside->Entries()) {
        if (!S_ISREG(entry.type) || !entry.name.starts_with(prefix)) continue;
        const auto info = inside->StatusOf(entry.name);
        if (!info || !IsAppleDouble(*inside, entry.name)) continue;
        consider({inside, entry.name, *info}, entry.name.substr(prefix.size()));
    }
    const DirectoryRef ea_dir = inside->FindIn(kEaDirName);
    if (!ea_dir) return;
    for (const LeftOver& file : FindLeftOver(*inside, *ea_dir)) {
        const std::string first = file.path.substr(0, file.path.find('/'));
        for (const std::string& object : MayBelongTo(made, first)) consider(file.found, object);
        if (first != file.path) (void)ea_dir->RemoveEmpty(first);
    }
    inside->Forget(kEaDirName);
    RemoveEaDirectoryIfEmpty(*inside);
}

void RemoveLeftMetadata(const Place& from, const timespec& began) {
    const Object object = ObjectAt(from, nullptr);
    const Sidecars left = Sidecars::Find(object, Sidecars::Services::kFind);
    if (!left.Any()) return;
    std::vector<Sidecars::Found> files = left.Files();
    std::erase_if(files, [&](const Sidecars::Found& found) {
        return !S_ISDIR(found.info.st_mode) && !IsBefore(found.info.st_ctim, began);
    });
    RemoveFiles(files);
    RemoveEmptyDirectories(object, left);
}

}  // namespace mavoea::tool
