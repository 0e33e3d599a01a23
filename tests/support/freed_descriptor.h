// A descriptor's number, free for what is opened next.
#ifndef MAVOEA_TESTS_SUPPORT_FREED_DESCRIPTOR_H_
#define MAVOEA_TESTS_SUPPORT_FREED_DESCRIPTOR_H_

#include <fcntl.h>
#include <unistd.h>

namespace mavoea::test {

// What has the number gets it back in the end. All lower numbers are to be in use.
class FreedDescriptor {
 public:
    explicit FreedDescriptor(int number)
        : number_(number), kept_(fcntl(number, F_DUPFD_CLOEXEC, 10)) {
        ::close(number_);
    }
    ~FreedDescriptor() {
        ::close(number_);
        if (kept_ < 0) return;
        dup2(kept_, number_);
        ::close(kept_);
    }
    FreedDescriptor(const FreedDescriptor&) = delete;
    FreedDescriptor& operator=(const FreedDescriptor&) = delete;

    bool taken() const { return fcntl(number_, F_GETFD) != -1; }

 private:
    int number_;
    int kept_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_FREED_DESCRIPTOR_H_
