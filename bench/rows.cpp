#include "bench/rows.h"

#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <stdexcept>

namespace mavoea::bench {

void Require(bool held, const std::string& what) {
    if (!held) throw std::runtime_error(errno == 0 ? what : what + ": " + strerror(errno));
}

std::string Place::NewPath() const {
    static int number = 0;
    return *directory / ("file " + std::to_string(++number));
}

File::File(const std::string& path, int flags) : fd_(open(path.c_str(), flags, 0600)) {
    Require(fd_ >= 0, "cannot open " + path);
}

File::~File() { close(fd_); }

test::Bytes File::Read(std::int64_t offset, std::size_t size) const {
    test::Bytes bytes(size);
    const ssize_t got = pread(fd_, bytes.data(), size, offset);
    Require(got >= 0, "cannot read a file");
    bytes.resize(static_cast<std::size_t>(got));
    return bytes;
}

std::int64_t File::Size() const {
    struct stat info;
    Require(fstat(fd_, &info) == 0, "cannot tell a file's size");
    return info.st_size;
}

}  // namespace mavoea::bench
