#include "tools/show/property_list.h"

#include <plist/plist.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <new>
#include <string_view>

#include "tools/show/dates.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kBinaryMagic = "bplist00";
constexpr int kDepthMax = 32;
constexpr std::size_t kNodesMax = std::size_t{1} << 14;
constexpr std::uint64_t kContentsMax = std::uint64_t{1} << 20;  // bytes of texts and data
constexpr std::size_t kXmlContainersMax = 256;

constexpr const char* kNoList = "it is no property list";
constexpr const char* kDamaged = "its property list is damaged";
constexpr const char* kTooMuch = "its property list is too deep or too large";
constexpr const char* kTooLong = "it has more than 65536 bytes";
constexpr const char* kUnknown = "its property list holds something of another kind";

std::string_view AsText(ByteView bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

// ---- Before libplist sees it --------------------------------------------------------------------

// What is said of a binary list by its own objects, all of them reached from the root as libplist
// reaches them: it makes a node of each way to an object.
//
//   offset  size  field
//        0     8  "bplist00"
//        8        objects: a byte of kind and size, longer sizes as an integer object behind it;
//        then
//                 bytes, or numbers of objects
//                 where each object is
//      -32     6  unused
//      -26     1  bytes of an entry that says where an object is
//      -25     1  bytes of the number of an object
//      -24     8  how many objects there are
//      -16     8  number of the root
//       -8     8  where the table of objects' places is
class BinaryList {
 public:
    explicit BinaryList(ByteView bytes) : bytes_(bytes) {}

    // Null: there is nothing against it.
    const char* WhyNot() {
        if (bytes_.size() < kBinaryMagic.size() + kTrailerSize) return kDamaged;
        const std::uint64_t end = bytes_.size() - kTrailerSize;
        place_size_ = At(end + 6);
        number_size_ = At(end + 7);
        if (!IsSize(place_size_) || !IsSize(number_size_)) return kDamaged;
        count_ = Load(end + 8, 8);
        const std::uint64_t root = Load(end + 16, 8);
        table_ = Load(end + 24, 8);
        if (table_ < kBinaryMagic.size() || table_ >= end) return kDamaged;
        if (count_ > (end - table_) / place_size_) return kDamaged;
        return Visit(root, 0);
    }

 private:
    static constexpr std::size_t kTrailerSize = 32;

    static bool IsSize(unsigned size) { return size == 1 || size == 2 || size == 4 || size == 8; }

    // In the list.
    std::uint8_t At(std::uint64_t at) const { return bytes_[static_cast<std::size_t>(at)]; }

    std::uint64_t Load(std::uint64_t at, unsigned size) const {
        std::uint64_t value = 0;
        for (unsigned i = 0; i < size; ++i) value = value << 8 | At(at + i);
        return value;
    }

    const char* Visit(std::uint64_t number, int depth) {
        if (number >= count_) return kDamaged;
        if (depth > kDepthMax || ++nodes_ > kNodesMax) return kTooMuch;
        std::uint64_t at = Load(table_ + number * place_size_, place_size_);
        if (at < kBinaryMagic.size() || at >= table_) return kDamaged;
        const unsigned kind = At(at) >> 4;
        std::uint64_t size = At(at) & 0xFU;
        ++at;
        const bool is_long = size == 0xF && kind >= 0x4 && kind != 0x8;
        if (is_long) {
            if (at >= table_ || At(at) >> 4 != 1 || (At(at) & 0xFU) > 3) return kDamaged;
            const unsigned size_size = 1U << (At(at) & 0xFU);
            ++at;
            if (table_ - at < size_size) return kDamaged;
            size = Load(at, size_size);
            at += size_size;
        }
        return VisitObject(kind, at, size, depth);
    }

    // `at` is not behind the table.
    const char* VisitObject(unsigned kind, std::uint64_t at, std::uint64_t size, int depth) {
        const std::uint64_t left = table_ - at;
        switch (kind) {
            case 0x0:  // 8 and 9 are false and true
                return size == 8 || size == 9 ? nullptr : kUnknown;
            case 0x1:
                if (size > 3) return kUnknown;
                return left >= std::uint64_t{1} << size ? nullptr : kDamaged;
            case 0x2:
                if (size != 2 && size != 3) return kDamaged;
                return left >= std::uint64_t{1} << size ? nullptr : kDamaged;
            case 0x3:
                return size == 3 && left >= 8 ? nullptr : kDamaged;
            case 0x4:
                return size <= left ? VisitContents(size) : kDamaged;
            case 0x5:
                if (size > left) return kDamaged;
                if (HasNul(at, size, 1)) return kUnknown;
                return VisitContents(size);
            case 0x6:
                if (size > left / 2 || size == 0) return kDamaged;
                if (HasNul(at, size, 2)) return kUnknown;
                return VisitContents(2 * size);
            case 0x8:
                if (!IsSize(static_cast<unsigned>(size + 1)) || size + 1 > left) return kDamaged;
                return Load(at, static_cast<unsigned>(size + 1)) <= UINT32_MAX ? nullptr : kUnknown;
            case 0xA:
            case 0xC:
                if (size > left / number_size_) return kDamaged;
                return VisitAll(at, size, depth);
            case 0xD:
                if (size > left / number_size_ / 2) return kDamaged;
                return VisitAll(at, 2 * size, depth);
            default:
                return kUnknown;
        }
    }

    const char* VisitAll(std::uint64_t at, std::uint64_t count, int depth) {
        for (std::uint64_t i = 0; i < count; ++i) {
            const char* const why = Visit(Load(at + i * number_size_, number_size_), depth + 1);
            if (why != nullptr) return why;
        }
        return nullptr;
    }

    const char* VisitContents(std::uint64_t size) {
        contents_ += size;
        return contents_ <= kContentsMax ? nullptr : kTooMuch;
    }

    bool HasNul(std::uint64_t at, std::uint64_t count, unsigned size) const {
        for (std::uint64_t i = 0; i < count; ++i) {
            if (Load(at + i * size, size) == 0) return true;
        }
        return false;
    }

    ByteView bytes_;
    unsigned place_size_ = 0;
    unsigned number_size_ = 0;
    std::uint64_t count_ = 0;
    std::uint64_t table_ = 0;
    std::size_t nodes_ = 0;
    std::uint64_t contents_ = 0;
};

bool IsXml(std::string_view text) {
    return text.starts_with("<?xml") || text.starts_with("<!DOCTYPE") || text.starts_with("<plist");
}

// Depth is not to be told from tags that may stand in comments: no more containers than the stack
// has room for, however they lie.
const char* WhyNotXml(std::string_view text) {
    if (text.find('\0') != std::string_view::npos) return kDamaged;
    std::size_t containers = 0;
    for (const std::string_view tag : {"<array", "<dict"}) {
        for (std::size_t at = 0; (at = text.find(tag, at)) != std::string_view::npos; ++at) {
            if (++containers > kXmlContainersMax) return kTooMuch;
        }
    }
    return nullptr;
}

// ---- Nodes --------------------------------------------------------------------------------------

std::string StringOf(plist_t node) {
    std::uint64_t size = 0;
    const char* const text = plist_get_string_ptr(node, &size);
    return text == nullptr ? std::string() : std::string(text, static_cast<std::size_t>(size));
}

struct FreeMemory {
    void operator()(void* memory) const { std::free(memory); }  // NOLINT: libplist has allocated it
};

template <class Use>
void ForEachItem(plist_t array, Use use) {
    plist_array_iter iterator = nullptr;
    plist_array_new_iter(array, &iterator);
    const std::unique_ptr<void, FreeMemory> owned(iterator);
    for (;;) {
        plist_t item = nullptr;
        plist_array_next_item(array, iterator, &item);
        if (item == nullptr) return;
        use(item);
    }
}

template <class Use>
void ForEachMember(plist_t dict, Use use) {
    plist_dict_iter iterator = nullptr;
    plist_dict_new_iter(dict, &iterator);
    const std::unique_ptr<void, FreeMemory> owned(iterator);
    for (;;) {
        char* key = nullptr;
        plist_t value = nullptr;
        plist_dict_next_item(dict, iterator, &key, &value);
        const std::unique_ptr<char, FreeMemory> owned_key(key);
        if (key == nullptr || value == nullptr) return;
        use(std::string(key), value);
    }
}

Json DateJson(plist_t node) {
    constexpr std::int64_t kEpoch = 978307200;  // 2001-01-01 UTC
    std::int32_t seconds = 0;
    std::int32_t microseconds = 0;
    plist_get_date_val(node, &seconds, &microseconds);
    return Json(*DateText(kEpoch + seconds));
}

// Whether libplist had room for it.
bool IsDateInRange(plist_t node) {
    std::int32_t seconds = 0;
    std::int32_t microseconds = 0;
    plist_get_date_val(node, &seconds, &microseconds);
    return seconds != INT32_MIN && seconds != INT32_MAX;
}

bool IsDecodable(plist_t node) {
    bool all = true;
    switch (plist_get_node_type(node)) {
        case PLIST_DATE:
            return IsDateInRange(node);
        case PLIST_ARRAY:
            ForEachItem(node, [&](plist_t item) { all = all && IsDecodable(item); });
            return all;
        case PLIST_DICT:
            ForEachMember(
                node, [&](const std::string&, plist_t value) { all = all && IsDecodable(value); });
            return all;
        default:
            return true;
    }
}

Json NodeJson(plist_t node) {
    switch (plist_get_node_type(node)) {
        case PLIST_BOOLEAN: {
            std::uint8_t value = 0;
            plist_get_bool_val(node, &value);
            return {value != 0};
        }
        case PLIST_UINT: {
            std::uint64_t value = 0;
            plist_get_uint_val(node, &value);
            return {static_cast<std::int64_t>(value)};
        }
        case PLIST_REAL: {
            double value = 0;
            plist_get_real_val(node, &value);
            return {value};
        }
        case PLIST_STRING:
            return {StringOf(node)};
        case PLIST_DATE:
            return DateJson(node);
        case PLIST_DATA: {
            std::uint64_t size = 0;
            const char* const data = plist_get_data_ptr(node, &size);
            if (data == nullptr) return {""};
            return {HexDigits(
                {reinterpret_cast<const std::uint8_t*>(data), static_cast<std::size_t>(size)})};
        }
        case PLIST_UID: {
            std::uint64_t value = 0;
            plist_get_uid_val(node, &value);
            return Json::Object({{"uid", Json(value)}});
        }
        case PLIST_ARRAY: {
            Json array = Json::Array();
            ForEachItem(node, [&](plist_t item) { array.Add(NodeJson(item)); });
            return array;
        }
        case PLIST_DICT: {
            Json object = Json::Object({});
            ForEachMember(node, [&](const std::string& key, plist_t value) {
                object.Set(key, NodeJson(value));
            });
            return object;
        }
        default:
            return {};
    }
}

Bytes Encode(plist_t root) {
    char* bytes = nullptr;
    std::uint32_t size = 0;
    plist_to_bin(root, &bytes, &size);
    const std::unique_ptr<char, FreeMemory> owned(bytes);
    if (bytes == nullptr) throw std::bad_alloc();
    return {bytes, bytes + size};
}

}  // namespace

void PropertyList::Free::operator()(void* node) const { plist_free(node); }

std::optional<PropertyList> PropertyList::Parse(ByteView bytes, std::string* reason) {
    const std::string text(AsText(bytes.first(std::min(bytes.size(), kPropertyListSizeMax))));
    const bool is_binary = text.starts_with(kBinaryMagic);
    const char* why = nullptr;
    if (bytes.size() > kPropertyListSizeMax) {
        why = kTooLong;
    } else if (is_binary) {
        why = BinaryList(bytes).WhyNot();
    } else {
        why = IsXml(text) ? WhyNotXml(text) : kNoList;
    }
    if (why != nullptr) {
        *reason = why;
        return std::nullopt;
    }
    plist_t root = nullptr;
    // The NUL behind the text ends what looks for the end of a number.
    const auto size = static_cast<std::uint32_t>(text.size());
    if (is_binary) {
        plist_from_bin(text.c_str(), size, &root);
    } else {
        plist_from_xml(text.c_str(), size, &root);
    }
    PropertyList list(root);
    if (root != nullptr && IsDecodable(root)) return list;
    *reason = root == nullptr ? kDamaged : kUnknown;
    return std::nullopt;
}

std::optional<std::string> PropertyList::Text() const {
    if (plist_get_node_type(root_.get()) != PLIST_STRING) return std::nullopt;
    return StringOf(root_.get());
}

std::optional<std::vector<std::string>> PropertyList::Texts() const {
    if (plist_get_node_type(root_.get()) != PLIST_ARRAY) return std::nullopt;
    std::vector<std::string> texts;
    bool all = true;
    ForEachItem(root_.get(), [&](plist_t item) {
        all = all && plist_get_node_type(item) == PLIST_STRING;
        if (all) texts.push_back(StringOf(item));
    });
    if (!all) return std::nullopt;
    return texts;
}

Json PropertyList::AsJson() const { return NodeJson(root_.get()); }

Bytes EncodePropertyList(const std::string& text) {
    const std::unique_ptr<void, decltype(&plist_free)> root(plist_new_string(text.c_str()),
                                                            &plist_free);
    return Encode(root.get());
}

Bytes EncodePropertyList(const std::vector<std::string>& texts) {
    const std::unique_ptr<void, decltype(&plist_free)> root(plist_new_array(), &plist_free);
    for (const std::string& text : texts) {
        plist_array_append_item(root.get(), plist_new_string(text.c_str()));
    }
    return Encode(root.get());
}

}  // namespace mavoea::tool
