// What the code under test writes to the system log: a test program that links this sees its lines
// here, and syslogd does not.
#ifndef MAVOEA_TESTS_PLATFORM_SUPPORT_SYSLOG_CAPTURE_H_
#define MAVOEA_TESTS_PLATFORM_SUPPORT_SYSLOG_CAPTURE_H_

#include <string>
#include <vector>

namespace mavoea::test {

// The lines since the last time, as "<priority>text".
std::vector<std::string> TakeSyslog();

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_PLATFORM_SUPPORT_SYSLOG_CAPTURE_H_
