#include <marucore/error.h>

#include <cstddef>
#include <cstring>

namespace {

struct ErrorSlot {
    int code;
    int line;
    char file[256];
};

thread_local ErrorSlot slot = {};

} // namespace

int MLIBCErrGet() {
    return slot.code;
}

const char* MLIBCErrorGetFile() {
    return slot.file;
}

int MLIBCErrorGetLine() {
    return slot.line;
}

void MLIBCErrSetEx(int code, const char* file, int line) {
    const char* const text = file ? file : "";
    const std::size_t size = strnlen(text, sizeof slot.file - 1);
    std::memmove(slot.file, text, size); // it may be what MLIBCErrorGetFile() gave
    slot.file[size] = '\0';
    slot.code = code;
    slot.line = line;
}
