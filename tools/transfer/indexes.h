// What the platform's search indexes are told.
#ifndef MAVOEA_TOOLS_TRANSFER_INDEXES_H_
#define MAVOEA_TOOLS_TRANSFER_INDEXES_H_

#include <sys/types.h>

#include <string>

namespace mavoea::tool {

void ReportNew(const std::string& path, mode_t mode);
void ReportRenamed(const std::string& from, const std::string& to);
void ReportRemoved(const std::string& path);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_INDEXES_H_
