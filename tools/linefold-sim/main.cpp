// linefold-sim: plays what stands around the daemon on a phone.
#include <algorithm>
#include <cstdio>
#include <string>
#include <vector>

#include "tools/linefold-sim/Roles.h"

namespace {

constexpr int kUsage = 2;

void Print(std::FILE* stream, std::string_view text) {
    (void)std::fwrite(text.data(), 1, text.size(), stream);
}

std::string Help() {
    std::string text = "Usage: linefold-sim ROLE [OPTIONS]\nPlays a part of the phone.\n\nRoles:\n";
    for (const auto& role : simulator::Roles()) {
        std::string name(role.name);
        name.resize(24, ' ');
        text += "  " + name + std::string(role.summary) + "\n";
    }
    return text + "\nlinefold-sim ROLE --help says more.\n";
}

int Refuse(std::string_view why) {
    Print(stderr, "linefold-sim: " + std::string(why) + "\nTry: linefold-sim --help\n");
    return kUsage;
}

int Run(std::span<const std::string_view> words) {
    if (words.empty()) {
        return Refuse("a role is missing");
    }
    if (words.front() == "--help") {
        Print(stdout, Help());
        return 0;
    }
    const auto role = std::ranges::find(simulator::Roles(), words.front(), &simulator::Role::name);
    if (role == simulator::Roles().end()) {
        return Refuse("there is no role " + std::string(words.front()));
    }
    if (std::ranges::find(words, "--help") != words.end()) {
        Print(stdout, "Usage: linefold-sim " + std::string(role->help));
        return 0;
    }
    return role->play(words.subspan(1));
}

}  // namespace

int main(int argc, char** argv) {
    const std::vector<std::string_view> words(argv + 1, argv + argc);
    // What it prints is read while it plays.
    (void)std::setvbuf(stdout, nullptr, _IOLBF, BUFSIZ);
    return Run(words);
}
