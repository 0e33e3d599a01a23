#include "tools/walk/counting.h"

#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <new>
#include <utility>

#include "tools/place/volume.h"
#include "tools/say/progress.h"
#include "tools/store/sidecars.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {

// Seen by both processes.
struct Counting::Shared {
    std::atomic<bool> counted = false;
    std::uint64_t total = 0;
};

Counting::Counting(Kind kind, std::vector<std::string> paths, Shard shard)
    : kind_(kind), paths_(std::move(paths)), shard_(shard) {
    ExpectTotal([this] { return Total(); });
}

Counting::~Counting() {
    ExpectTotal({});
    if (process_ > 0) {
        ::kill(process_, SIGKILL);
        while (::waitpid(process_, nullptr, 0) < 0 && errno == EINTR) continue;
    }
    if (shared_ != nullptr) ::munmap(shared_, sizeof(Shared));
}

std::optional<std::uint64_t> Counting::Total() {
    if (!begun_) Begin();
    if (shared_ == nullptr || !shared_->counted.load(std::memory_order_acquire)) return {};
    return shared_->total;
}

// Without another process nobody knows the total.
void Counting::Begin() {
    begun_ = true;
    void* const shared =
        ::mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (shared == MAP_FAILED) return;
    shared_ = new (shared) Shared;
    const pid_t first = ::getpid();
    process_ = ::fork();
    if (process_ != 0) return;
    (void)::prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (::getppid() == first) {
        shared_->total = Count();
        shared_->counted.store(true, std::memory_order_release);
    }
    ::_exit(0);
}

// What cannot be looked into counts for one.
std::uint64_t Counting::Count() const {
    struct Inner {
        Place place;
        PathHash hash;
    };
    std::uint64_t count = 0;
    std::vector<Inner> pending;
    const auto add = [&](const Place& place, mode_t type, PathHash hash) {
        if (shard_.Has(hash)) ++count;
        if (S_ISDIR(type)) pending.push_back({place, hash});
    };
    for (const std::string& path : paths_) {
        try {
            const Object object = FindObject(path);
            const auto info = object.place.Status();
            if (info) add(object.place, info->st_mode, PathHash::OfNamed(path));
        } catch (const Failure&) {  // the work will say so
        }
    }
    while (!pending.empty()) {
        const Inner outer = std::move(pending.back());
        pending.pop_back();
        try {
            const DirectoryRef inside = outer.place.directory->OpenIn(outer.place.name);
            for (const Directory::Entry& entry : ObjectsIn(inside)) {
                if (kind_ == Kind::kVisited && !IsVisited(entry)) continue;
                add({inside, entry.name}, entry.type, outer.hash.Below(entry.name));
            }
        } catch (const Failure&) {  // the work will say so
        }
    }
    return count;
}

}  // namespace mavoea::tool
