// One operation of the file-system manager, for a tracer to fail its calls: its result is the exit
// status.
#include <cstdio>
#include <string_view>

#include "handlers/files/FileSystemManager.h"

int main(int count, char** arguments) {
    if (count != 4) {
        (void)std::fprintf(stderr, "usage: file-operation copy|move|write SOURCE DESTINATION\n");
        return 2;
    }
    const std::string_view operation = arguments[1];
    const char* const source = arguments[2];
    const char* const destination = arguments[3];
    FileSystemManager manager;
    if (operation == "copy") {
        return manager.copyItem(source, destination) == 0 ? 0 : 1;
    }
    if (operation == "move") {
        return manager.moveItem(source, destination) == 0 ? 0 : 1;
    }
    const auto contents = manager.loadData(source);
    return contents && manager.writeData(destination, &*contents) ? 0 : 1;
}
