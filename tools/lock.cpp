#include "tools/lock.h"

#include "adouble/ea_copy_lock.h"
#include "format/apple_double.h"
#include "tools/messages.h"
#include "tools/record.h"
#include "tools/store.h"
#include "util/volume_kind.h"

namespace mavoea::tool {
namespace {

// The AFP attributes each of which locks.
constexpr std::uint16_t kLocking = kAfpNoWrite | kAfpNoRename | kAfpNoDelete;

// Where the volume's record is that has a say in the state; none on volumes that keep it in the
// permissions.
std::optional<RecordPlace> PlaceOfRecord(const Object& object) {
    switch (VolumeKindOf(object.type)) {
        case VolumeKind::kEADir:
            return RecordPlace::kResourceFile;
        case VolumeKind::kFileEA:
            return RecordPlace::kAttribute;
        default:
            return std::nullopt;
    }
}

std::optional<Record> ReadRecord(const Object& object) {
    const auto place = PlaceOfRecord(object);
    return place ? Record::Read(object.path, *place) : std::nullopt;
}

LockGetter GetterFor(const Object& object) {
    const LockGetter getter = LockGetterFor(object.type);
    if (getter == nullptr) throw NoStore(object);
    return getter;
}

}  // namespace

LockState LockStateOf(const Object& object) {
    switch (GetterFor(object)(object.path.c_str())) {
        case 0:
            return LockState::kUnlocked;
        case 1:
            return LockState::kLocked;
        default:
            return LockState::kUnknown;
    }
}

bool IsLocked(const Object& object) {
    const ErrorMark mark;
    const int state = GetterFor(object)(object.path.c_str());
    if (state >= 0) return state == 1;
    const LibraryError error = mark.Get();
    (void)ReadRecord(object);  // has the better words for what is wrong with it
    throw LibraryFailure(object.path, error);
}

void SetLocked(const Object& object, bool locked) {
    const LockGetter getter = GetterFor(object);
    const LockSetter setter = LockSetterFor(object.type, object.type);
    if (setter == nullptr) throw NoStore(object);
    (void)ReadRecord(object);
    {
        const KeptDescriptor kept;
        const ErrorMark mark;
        if (setter(object.path.c_str(), locked ? 1 : 0) < 0) {
            throw LibraryFailure(object.path, mark.Get());
        }
    }
    if (!locked && getter(object.path.c_str()) == 1) {
        // The setter leaves alone what the AFP service has said in the record.
        auto record = ReadRecord(object);
        if (record && (record->AfpAttributes() & kLocking) != 0) {
            record->ClearAfpAttributes(kLocking);
            record->Flush();
        }
    }
    if (IsLocked(object) == locked) return;
    throw Failure(kFailed, object.path,
                  locked ? "its file system cannot keep the locked state" : "it stays locked",
                  "the locked state takes a file system with attributes of users, and an object "
                  "that may have them");
}

}  // namespace mavoea::tool
