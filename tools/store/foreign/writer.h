// Putting what is known of an object where Samba, netatalk and others look for it.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_WRITER_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_WRITER_H_

#include "tools/place/dialect.h"
#include "tools/store/writer.h"

namespace mavoea::tool {

const Writer& ForeignWriterFor(const Dialect& dialect);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_WRITER_H_
