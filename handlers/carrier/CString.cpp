#include "handlers/carrier/CString.h"

#include <cstdlib>
#include <cstring>

#include "platform/Utf8.h"

const CStringAllocator kDefaultCStringAllocator{.allocate = std::malloc, .deallocate = std::free};

namespace {

/// Bytes from the start that the encoding expresses without loss.
std::size_t EncodedLength(std::string_view string, StringEncoding encoding) {
    std::size_t length = 0;
    while (length < string.size()) {
        const std::size_t step = platform::Utf8SequenceLength(string.substr(length));
        if (step == 0 || (encoding == StringEncoding::kAscii && step > 1)) {
            break;
        }
        length += step;
    }
    return length;
}

void Terminate(char* into, std::string_view string) {
    std::memcpy(into, string.data(), string.size());
    into[string.size()] = '\0';
}

}  // namespace

char* _CFStringGetOrCreateCString(const CStringAllocator& allocator,
                                  std::string_view string,
                                  char* buffer,
                                  std::size_t* length,
                                  StringEncoding encoding) {
    const std::size_t bufferSize = buffer != nullptr && length != nullptr ? *length : 0;
    const std::size_t encodedLength = EncodedLength(string, encoding);
    char* result = buffer;
    std::size_t resultLength = 0;
    if (encodedLength == string.size() && encodedLength < bufferSize) {
        Terminate(buffer, string);
        resultLength = encodedLength;
    } else if (auto* block = static_cast<char*>(allocator.allocate(encodedLength + 1));
               block != nullptr) {
        Terminate(block, string.substr(0, encodedLength));
        result = block;
        resultLength = encodedLength;
    } else if (buffer != nullptr) {
        *buffer = '\0';
    }
    if (length != nullptr) {
        *length = resultLength;
    }
    return result;
}
