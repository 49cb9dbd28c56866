// A visual-voicemail library for the tests: it writes down that it was loaded and asked, and is
// told by a file what to answer. /run/voicemail/subscribed makes the subscriber one.
#include <fcntl.h>
#include <unistd.h>

#include <cstring>

namespace {

void Note(const char* what) {
    const int file =
        open("/run/voicemail/journal", O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0600);
    if (write(file, what, std::strlen(what)) < 0 || close(file) != 0) {
        _exit(1);
    }
}

__attribute__((constructor)) void NoteLoading() {
    Note("loaded\n");
}

}  // namespace

// The name is the library's, whose language puts the underscore in front.
extern "C" __attribute__((visibility("default"))) bool IsSubscribed() __asm__(
    "_MBSharedServiceIsSubscribed");

bool IsSubscribed() {
    Note("asked\n");
    return access("/run/voicemail/subscribed", F_OK) == 0;
}
