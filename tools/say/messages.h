// What went wrong, for people: "PATH: cause; what to do". What the tool says in the place of a
// command that people know ends before the advice.
#ifndef MAVOEA_TOOLS_SAY_MESSAGES_H_
#define MAVOEA_TOOLS_SAY_MESSAGES_H_

#include <stdexcept>
#include <string>
#include <string_view>

namespace mavoea::tool {

enum ExitStatus : int {
    kSuccess = 0,
    kNotFound = 1,
    kRefused = 1,  // cp, mv and rm: anything that they could not do
    kUnsound = 1,  // check: something was found
    kFailed = 2
};

// What is behind a failure, for those to whom damage that they looked for is none of theirs.
enum class Fault {
    kOther,
    kDamage,  // it could be looked at, and does not hold what it should
    kInUse    // another process has it locked
};

class Failure : public std::runtime_error {
 public:
    Failure(ExitStatus status, std::string_view subject, std::string_view cause,
            std::string_view advice, Fault fault = Fault::kOther);

    ExitStatus status() const { return status_; }
    const std::string& subject() const { return subject_; }
    const std::string& cause() const { return cause_; }
    const std::string& brief() const { return brief_; }  // without the advice
    Fault fault() const { return fault_; }

 protected:
    Failure(ExitStatus status, const std::string& sentence, std::string_view advice);

 private:
    ExitStatus status_;
    std::string subject_;
    std::string cause_;
    std::string brief_;
    Fault fault_ = Fault::kOther;
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

// What commands like cp say, in their words: names in it are for people already.
class Refusal : public Failure {
 public:
    Refusal(const std::string& sentence, std::string_view advice)
        : Failure(kRefused, sentence, advice) {}
    // "cannot stat 'x'", and the words for errno.
    Refusal(const std::string& what, int error)
        : Failure(kRefused, what + ": " + SystemFailure::Words(error),
                  SystemFailure::Advice(error)) {}
};

// An object has arrived, and its metadata has not, or not all of it.
class Incomplete : public Failure {
 public:
    using Failure::Failure;
};

// What did not arrive has no place there, or none that could be read.
class Loss : public Incomplete {
 public:
    using Incomplete::Incomplete;
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
