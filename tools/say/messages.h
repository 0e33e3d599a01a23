// What went wrong, for people: "PATH: cause; what to do".
#ifndef MAVOEA_TOOLS_SAY_MESSAGES_H_
#define MAVOEA_TOOLS_SAY_MESSAGES_H_

#include <stdexcept>
#include <string>
#include <string_view>

namespace mavoea::tool {

enum ExitStatus : int { kSuccess = 0, kNotFound = 1, kFailed = 2 };

class Failure : public std::runtime_error {
 public:
    Failure(ExitStatus status, std::string_view subject, std::string_view cause,
            std::string_view advice);

    ExitStatus status() const { return status_; }
    const std::string& subject() const { return subject_; }
    const std::string& cause() const { return cause_; }

 private:
    ExitStatus status_;
    std::string subject_;
    std::string cause_;
};

// A system call's failure, by its errno: kNotFound for ENOENT.
class SystemFailure : public Failure {
 public:
    SystemFailure(std::string_view path, int error);

    int error() const { return error_; }

    // What to say of an errno, and what to do.
    static const char* Words(int error);
    static const char* Advice(int error);

 private:
    int error_;
};

// What did not arrive, of an object that otherwise has.
class Loss : public Failure {
 public:
    using Failure::Failure;
};

// What a failed call of the library left behind.
struct LibraryError {
    int code = 0;   // on the error stack, 0 when it recorded none
    int error = 0;  // errno
};

// Stands before a call of the library, so that what lies on the error stack from earlier calls is
// not taken for its own.
class ErrorMark {
 public:
    ErrorMark();
    LibraryError Get() const;  // right after the call
};

// Why the library could not do its work on the file or object `path`.
Failure LibraryFailure(std::string_view path, LibraryError error);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_MESSAGES_H_
