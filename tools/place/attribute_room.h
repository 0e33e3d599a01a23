// How much an object's extended attributes may take on file systems of the ext family: a few bytes
// in its inode, and one block. (Where they were made with the feature ea_inode there is more, but
// they tell nobody.)
#ifndef MAVOEA_TOOLS_PLACE_ATTRIBUTE_ROOM_H_
#define MAVOEA_TOOLS_PLACE_ATTRIBUTE_ROOM_H_

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>

namespace mavoea::tool {

// One object's, filled as the kernel fills it: an attribute goes into the inode if it fits there,
// into the block if not.
class AttributeRoom {
 public:
    explicit AttributeRoom(std::size_t block_size)
        : block_{.most = block_size < kBlockHead ? 0 : block_size - kBlockHead, .sizes = {}} {}

    // False where there is no room for it: then all is as it was. `size` is the value's, in bytes.
    bool Put(const std::string& name, std::size_t size);
    void Remove(const std::string& name);

 private:
    struct Area {
        std::size_t most;                          // in bytes
        std::size_t used = 0;                      // the same
        std::map<std::string, std::size_t> sizes;  // with their names

        bool Put(const std::string& name, std::size_t size);
        void Remove(const std::string& name);
    };

    // Inodes of 256 bytes, of which 32 are the file system's own further fields.
    static constexpr std::size_t kInodeRoom = 256 - 128 - 32 - sizeof(std::uint32_t) * 2;
    static constexpr std::size_t kBlockHead = 32 + sizeof(std::uint32_t);

    Area inode_{.most = kInodeRoom, .sizes = {}};
    Area block_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_ATTRIBUTE_ROOM_H_
