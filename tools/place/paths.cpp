#include "tools/place/paths.h"

#include <fcntl.h>
#include <limits.h>
#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <iostream>
#include <string_view>

#include "tools/say/interrupt.h"

namespace mavoea::tool {
namespace {

constexpr std::size_t kLongest = PATH_MAX - 1;  // bytes of a path that calls take
constexpr std::size_t kBufferSize = std::size_t{1} << 16;

// That a list is not there says nothing of any object.
Failure ListFailure(const std::string& list, int error) {
    return {kFailed, list, SystemFailure::Words(error), SystemFailure::Advice(error)};
}

File OpenList(const std::string& list) {
    const int fd = list == "-" ? ::fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 0)
                               : ::open(list.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY);
    if (fd < 0) throw ListFailure(list, errno);
    return {fd, list};
}

}  // namespace

std::optional<std::string> PathReader::Next() {
    if (!paths_.list) {
        if (next_ == paths_.arguments.size()) return std::nullopt;
        return paths_.arguments[next_++];
    }
    try {
        return NextInList();
    } catch (const Failure& failure) {
        ended_ = true;
        fail_(failure);
        return std::nullopt;
    }
}

std::optional<std::string> PathReader::NextInList() {
    while (!ended_) {
        std::string name;
        bool fits = true;
        bool has_end = false;
        while (!has_end && (at_ < buffer_.size() || Fill())) {
            const std::string_view rest = {buffer_.data() + at_, buffer_.size() - at_};
            const std::string_view part = rest.substr(0, rest.find('\0'));
            has_end = part.size() < rest.size();
            fits = fits && part.size() <= kLongest - name.size();
            if (fits) name += part;
            at_ += part.size() + (has_end ? 1 : 0);
        }
        if (!has_end) {
            ended_ = true;
            const bool nothing = name.empty() && fits;
            if (nothing || Interrupted() != 0) return std::nullopt;
        }
        ++number_;
        if (fits && !name.empty()) return name;
        fail_(fits ? Failure(kFailed, Called(), "invalid zero-length file name",
                             "put nothing but one NUL between two paths")
                   : ListFailure(Called(), ENAMETOOLONG));
    }
    return std::nullopt;
}

// False at the end.
bool PathReader::Fill() {
    constexpr int kWait = 100;  // milliseconds
    if (!file_) file_.emplace(OpenList(*paths_.list));
    pollfd input = {file_->fd(), POLLIN, 0};
    // Whoever reads what has been found need not wait until there is more.
    if (::poll(&input, 1, 0) == 0) {
        wait_();
        std::cout.flush();
    }
    buffer_.resize(kBufferSize);
    at_ = 0;
    while (Interrupted() == 0) {
        const int ready = ::poll(&input, 1, kWait);
        if (ready == 0 || (ready < 0 && errno == EINTR)) continue;
        const ssize_t size = ::read(input.fd, buffer_.data(), buffer_.size());
        if (size < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (size < 0) throw ListFailure(*paths_.list, errno);
        buffer_.resize(static_cast<std::size_t>(size));
        return size > 0;
    }
    buffer_.clear();
    return false;
}

// The name in hand.
std::string PathReader::Called() const { return *paths_.list + ':' + std::to_string(number_); }

}  // namespace mavoea::tool
