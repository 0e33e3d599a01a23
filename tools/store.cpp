#include "tools/store.h"

#include "format/ea_stream.h"
#include "platform/include/mavocore.h"
#include "tools/lock.h"

namespace mavoea::tool {
namespace {

#if MAVOEA_HOST_PLATFORM
constexpr const char* kDeclareVolume =
    "declare it with --volume PATH=TYPE or in " MAVO_VOLUME_TABLE;
#else
constexpr const char* kDeclareVolume = "move the object to another volume";
#endif

// Any store, and the locked state beside what it has.
class LockableStore final : public Store {
 public:
    LockableStore(const Object& object, std::unique_ptr<Store> store)
        : object_(object), store_(std::move(store)) {}

    std::vector<Attribute> List() override {
        std::vector<Attribute> list = store_->List();
        std::erase_if(list, [](const Attribute& found) { return found.name == kLockedName; });
        // Where it cannot be told, the list is still good for the rest.
        if (LockStateOf(object_) == LockState::kLocked) {
            list.push_back({std::string(kLockedName), 1, Kind::kLocked, object_.path});
        }
        return list;
    }

    std::optional<Bytes> Get(const std::string& name) override {
        if (KindOf(name) != Kind::kLocked) return store_->Get(name);
        return Bytes{static_cast<std::uint8_t>(IsLocked(object_) ? '1' : '0')};
    }

    void Set(const std::string& name, const Bytes& value) override {
        if (KindOf(name) != Kind::kLocked) return store_->Set(name, value);
        if (value.size() != 1 || (value[0] != '0' && value[0] != '1')) {
            throw Failure(kFailed, object_.path, "the locked state is 0 or 1",
                          "give it without a line's end, or use mavoea lock and mavoea unlock");
        }
        SetLocked(object_, value[0] == '1');
    }

    bool Remove(const std::string& name) override {
        if (KindOf(name) != Kind::kLocked) return store_->Remove(name);
        if (!IsLocked(object_)) return false;
        SetLocked(object_, false);
        return true;
    }

 private:
    Object object_;
    std::unique_ptr<Store> store_;
};

std::unique_ptr<Store> MakeStore(const Object& object) {
    switch (object.keeping()) {
        case Keeping::kAppleDouble:
        case Keeping::kEaDirectory:
            RequireParent(object);
            return MakeEaFileStore(object);
        case Keeping::kXattr:
            return MakeXattrStore(object);
        case Keeping::kNone:
            break;
    }
    throw NoStore(object);
}

}  // namespace

std::unique_ptr<Store> OpenStore(const Object& object) {
    return std::make_unique<LockableStore>(object, MakeStore(object));
}

void RequireParent(const Object& object) {
    if (object.path != "/") return;
    throw Failure(kFailed, object.path, "the root has no directory to keep metadata in",
                  "name something below it");
}

void CheckFinderInfoSize(const std::string& path, const Bytes& value) {
    if (value.size() == kFinderInfoSize) return;
    throw Failure(kFailed, path,
                  "Finder info has " + std::to_string(kFinderInfoSize) + " bytes, the value has " +
                      std::to_string(value.size()),
                  "give all of them, as with --hex and 64 digits");
}

Failure NoStore(const Object& object) {
    if (object.type < 0) {
        return {kFailed, object.path, "the type of its volume is unknown", kDeclareVolume};
    }
    return {kFailed, object.path,
            "volumes of type " + std::to_string(object.type) + " keep no metadata", kDeclareVolume};
}

}  // namespace mavoea::tool
