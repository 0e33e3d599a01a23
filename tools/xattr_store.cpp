// Volumes that keep named attributes as the object's own extended attributes.

#include <cerrno>
#include <limits>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tools/messages.h"
#include "tools/store.h"

namespace mavoea::tool {
namespace {

// A list of the platform, which moves when it grows.
class StringList {
 public:
    StringList() : list_(MLIBCSzListAlloc(64)) {
        if (list_ == nullptr) throw std::bad_alloc();
    }
    ~StringList() { MLIBCSzListFree(list_); }
    StringList(const StringList&) = delete;
    StringList& operator=(const StringList&) = delete;

    MLIBCSzList** get() { return &list_; }
    const char* operator[](int index) const { return MLIBCSzListGet(list_, index); }

 private:
    MLIBCSzList* list_;
};

class XattrStore final : public Store {
 public:
    explicit XattrStore(const Object& object) : path_(object.path) {}

    std::vector<Attribute> List() override {
        StringList names;
        const ErrorMark mark;
        if (MAVOEAXattrEnum(path_.c_str(), names.get()) != 0) {
            throw LibraryFailure(path_, mark.Get());
        }
        std::vector<Attribute> list;
        for (int i = 0; names[i] != nullptr; ++i) {
            const std::string name = names[i];
            // One that has gone meanwhile, or may not be read, has no size.
            const int size = SizeOf(name);
            list.push_back(
                {name, static_cast<std::uint64_t>(size < 0 ? 0 : size), KindOf(name), path_});
        }
        const std::string fork(kResourceForkName);
        if (const int size = SizeOf(fork); size >= 0) {
            list.push_back({fork, static_cast<std::uint64_t>(size), Kind::kResourceFork, path_});
        }
        return list;
    }

    std::optional<Bytes> Get(const std::string& name) override {
        constexpr int kAttempts = 8;  // Another process may let the value grow in between.
        for (int attempt = 1;; ++attempt) {
            const ErrorMark mark;
            Bytes value;
            int size = SizeOf(name);
            if (size > 0) {
                value.resize(static_cast<std::size_t>(size));
                size = MAVOEAXattrGet(path_.c_str(), name.c_str(), value.data(), size);
            }
            if (size >= 0) {
                value.resize(static_cast<std::size_t>(size));
                return value;
            }
            const LibraryError error = mark.Get();
            if (IsAbsent(name, error)) return std::nullopt;
            if (error.error != ERANGE || attempt == kAttempts) throw LibraryFailure(path_, error);
        }
    }

    void Set(const std::string& name, const Bytes& value) override {
        if (value.size() > std::size_t{std::numeric_limits<int>::max()}) {
            throw Failure(kFailed, path_, "the value has 2 GiB or more", "use a smaller value");
        }
        if (KindOf(name) == Kind::kFinderInfo) CheckFinderInfoSize(path_, value);
        static constexpr std::uint8_t kNothing = 0;  // The library takes no NULL.
        const ErrorMark mark;
        if (MAVOEAXattrSet(path_.c_str(), name.c_str(), value.empty() ? &kNothing : value.data(),
                           static_cast<int>(value.size()), 0) != 0) {
            const LibraryError error = mark.Get();
            if (KindOf(name) == Kind::kResourceFork && IsAbsent(name, error)) {
                throw Failure(kFailed, path_, "its file system offers no resource fork for it",
                              "only files have one, on volumes of Mac file systems");
            }
            throw LibraryFailure(path_, error);
        }
    }

    bool Remove(const std::string& name) override {
        // Emptying a fork that is empty succeeds.
        if (KindOf(name) == Kind::kResourceFork && !Get(name)) return false;
        const ErrorMark mark;
        if (MAVOEAXattrRemove(path_.c_str(), name.c_str()) == 0) return true;
        const LibraryError error = mark.Get();
        if (IsAbsent(name, error)) return false;
        throw LibraryFailure(path_, error);
    }

 private:
    int SizeOf(const std::string& name) const {
        return MAVOEAXattrGet(path_.c_str(), name.c_str(), nullptr, 0);
    }

    static bool IsAbsent(const std::string& name, const LibraryError& error) {
        if (KindOf(name) != Kind::kResourceFork) return error.error == ENODATA;
        // Directories have none, empty ones count as none, and most file systems offer none.
        return error.code == MAVOEA_ERR_NOTHING_THERE || error.error == ENOTDIR ||
               error.error == ENOENT;
    }

    std::string path_;
};

}  // namespace

std::unique_ptr<Store> MakeXattrStore(const Object& object) {
    return std::make_unique<XattrStore>(object);
}

}  // namespace mavoea::tool
