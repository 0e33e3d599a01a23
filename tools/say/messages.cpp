#include "tools/say/messages.h"

#include <cerrno>
#include <cstring>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

const char* AdviceFor(int error) {
    switch (error) {
        case EACCES:
        case EPERM:
            return "run mavoea as a user who may, or as root";
        case ENOENT:
        case ENOTDIR:
            return "check the path";
        case ENOSPC:
        case EDQUOT:
            return "free some space on the volume";
        case EROFS:
            return "mount the volume for writing";
        case ENOTSUP:
            return "the file system takes no attribute of that name, try one that begins with "
                   "\"user.\"";
        case ENAMETOOLONG:
            return "use a shorter name or path";
        case ERANGE:
        case E2BIG:
            return "use a shorter name or a smaller value";
        case EIO:
            return "check the disk";
        default:
            return "try again, or check the volume";
    }
}

// The words for a code, which a system call's error may follow.
const char* WordsFor(int code) {
    switch (code) {
        case MAVOEA_ERR_OPEN:
            return "its metadata could not be opened";
        case MAVOEA_ERR_WRITE:
            return "it could not be written";
        case MAVOEA_ERR_STAT:
            return "it could not be looked at";
        case MAVOEA_ERR_RENAME:
            return "it could not be renamed";
        case MAVOEA_ERR_REMOVE:
            return "it could not be removed";
        case MAVOEA_ERR_MAKE_DIRECTORY:
            return "its EA directory could not be made";
        default:
            return "a system call failed";
    }
}

}  // namespace

Failure::Failure(ExitStatus status, std::string_view subject, std::string_view cause,
                 std::string_view advice, Fault fault)
    : Failure(status, Printable(subject) + ": " + std::string(cause), advice) {
    subject_ = subject;
    cause_ = cause;
    fault_ = fault;
}

Failure::Failure(ExitStatus status, const std::string& sentence, std::string_view advice)
    : std::runtime_error(sentence + "; " + std::string(advice)),
      status_(status),
      cause_(sentence),
      brief_(sentence) {}

SystemFailure::SystemFailure(std::string_view path, int error)
    : Failure(error == ENOENT ? kNotFound : kFailed, path, Words(error), Advice(error)),
      error_(error) {}

const char* SystemFailure::Words(int error) { return std::strerror(error); }
const char* SystemFailure::Advice(int error) { return AdviceFor(error); }

ErrorMark::ErrorMark() {
    MLIBCErrSetEx(0, "mavoea", __LINE__);
    errno = 0;
}

LibraryError ErrorMark::Get() const {
    const int error = errno;
    return {MLIBCErrGet(), error};
}

Failure LibraryFailure(std::string_view path, LibraryError error) {
    switch (error.code) {
        case 0:
            if (error.error == 0) {
                return {kFailed, path, "its resource fork could not be moved",
                        "see whether the volume is full, and look at it with: mavoea dump FILE"};
            }
            return SystemFailure(path, error.error);
        case MAVOEA_ERR_BUFFER_MEMORY:
        case MAVOEA_ERR_MEMORY:
            return {kFailed, path, "out of memory", "close other programs and try again"};
        case MAVOEA_ERR_LOCK:
            if (error.error != EAGAIN && error.error != EACCES && error.error != 0) {
                return {kFailed, path,
                        std::string("it could not be locked: ") + std::strerror(error.error),
                        AdviceFor(error.error)};
            }
            return {kFailed, path, "in use by another process", "try again", Fault::kInUse};
        case MAVOEA_ERR_NOTHING_THERE:
            return {kNotFound, path, "nothing is there", "mavoea list PATH has what is"};
        case MAVOEA_ERR_READ:
            return {kFailed, path, "damaged, or it could not be read",
                    "look at it with: mavoea dump FILE"};
        case MAVOEA_ERR_BAD_APPLEDOUBLE:
            return {kFailed, path, "its AppleDouble header is not acceptable",
                    "look at it with: mavoea dump FILE"};
        case MAVOEA_ERR_BAD_ARGUMENT:
            return {kFailed, path,
                    "refused: a stream takes at most 13 entries, 65,535 attributes and 4 GiB",
                    "look at it with: mavoea dump FILE"};
        case MAVOEA_ERR_NOT_PERMITTED:
            return {kFailed, path, "its lock does not allow this", "try again"};
        case MAVOEA_ERR_NO_ATTRIBUTE:
            return {kNotFound, path, "no such attribute", "mavoea list PATH has the names"};
        case MAVOEA_ERR_RANGE:
            return {kFailed, path, "it changed while it was read", "try again"};
        case MAVOEA_ERR_NAME_TOO_LONG:
            return {kFailed, path, "the path of its metadata would be too long",
                    "use a shorter name or path"};
        case MAVOEA_ERR_BASE_NAME:
            return {kFailed, path, "it has no name", "check the path"};
        default:
            break;
    }
    std::string cause = WordsFor(error.code);
    if (error.error != 0) cause += std::string(": ") + std::strerror(error.error);
    return {kFailed, path, cause, AdviceFor(error.error)};
}

}  // namespace mavoea::tool
