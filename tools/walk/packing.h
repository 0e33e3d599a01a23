// Numbers and texts on their way from one of this tool's processes to another on the same machine.
#ifndef MAVOEA_TOOLS_WALK_PACKING_H_
#define MAVOEA_TOOLS_WALK_PACKING_H_

#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <type_traits>

#include "tools/say/messages.h"

namespace mavoea::tool {

// Of what is nothing but its bytes.
template <class Value>
std::string Packed(const Value& value) {
    static_assert(std::is_trivially_copyable_v<Value>);
    return {reinterpret_cast<const char*>(&value), sizeof value};
}

// What went wrong with an object, in the words of the process that it went wrong in.
struct ToldFailure {
    std::string path;
    ExitStatus status;
    std::string message;
};

class Packer {
 public:
    void AddNumber(std::uint64_t number) { bytes_ += Packed(number); }
    void AddText(std::string_view text) {
        AddNumber(text.size());
        bytes_ += text;
    }
    void AddFailure(const std::string& path, const Failure& failure) {
        AddText(path);
        AddNumber(static_cast<std::uint64_t>(failure.status()));
        AddText(failure.what());
    }
    const std::string& bytes() const { return bytes_; }

 private:
    std::string bytes_;
};

// Takes off what a Packer has put there, in the same order. Throws Failure where there is less.
class Unpacker {
 public:
    explicit Unpacker(std::string_view bytes) : bytes_(bytes) {}

    template <class Value>
    Value Take() {
        static_assert(std::is_trivially_copyable_v<Value>);
        Require(sizeof(Value));
        Value value;
        std::memcpy(&value, bytes_.data(), sizeof value);
        bytes_.remove_prefix(sizeof value);
        return value;
    }
    std::uint64_t TakeNumber() { return Take<std::uint64_t>(); }
    std::string_view TakeText() {
        const auto size = static_cast<std::size_t>(TakeNumber());
        Require(size);
        const std::string_view text = bytes_.substr(0, size);
        bytes_.remove_prefix(size);
        return text;
    }
    ToldFailure TakeFailure() {
        ToldFailure told;
        told.path = TakeText();
        told.status = static_cast<ExitStatus>(TakeNumber());
        told.message = TakeText();
        return told;
    }
    bool empty() const { return bytes_.empty(); }

 private:
    void Require(std::size_t size) const {
        if (bytes_.size() >= size) return;
        throw Failure(kFailed, "what another process told", "it is cut short",
                      "give the command again");
    }

    std::string_view bytes_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_PACKING_H_
