#include "tests/support/HostileArchives.h"

#include <cerrno>
#include <utility>

#include "tests/support/ZipWriter.h"

namespace zip {
namespace {

using Lines = std::vector<std::string>;

// Before and behind what is hostile: the rest of an archive is to be expanded.
const Entry kBefore = File("before", "one");
const Entry kBehind = File("behind", "two");
const std::string kBeforeLine = "f 0644 before one";
const std::string kBehindLine = "f 0644 behind two";

std::string LeftOut(int error, const std::string& name) {
    return "left out " + std::to_string(error) + " " + name;
}

std::string Fatal(int error) {
    return "fatal " + std::to_string(error);
}

HostileArchive Whole(std::string name, std::vector<Entry> entries, Lines outcome) {
    return {.name = std::move(name), .bytes = Write(std::move(entries)), .outcome = outcome};
}

/// The entry is left out, and the others are expanded.
HostileArchive Refused(std::string name, Entry entry, int error, const std::string& shown) {
    return Whole(std::move(name),
                 {kBefore, std::move(entry), kBehind},
                 {kBeforeLine, kBehindLine, LeftOut(error, shown)});
}

HostileArchive Refused(std::string name, const Entry& entry, int error) {
    return Refused(std::move(name), entry, error, entry.name);
}

/// Nobody can tell where the next entry is, so the expansion ends.
HostileArchive Broken(std::string name, Entry entry) {
    return Whole(
        std::move(name), {kBefore, std::move(entry), kBehind}, {kBeforeLine, Fatal(EILSEQ)});
}

/// Nothing comes out of it.
HostileArchive Unreadable(std::string name, std::string bytes) {
    return {.name = std::move(name), .bytes = std::move(bytes), .outcome = {Fatal(EILSEQ)}};
}

std::string Repeat(const std::string& text, int times) {
    std::string repeated;
    for (int i = 0; i < times; ++i) {
        repeated += text;
    }
    return repeated;
}

void AddNames(std::vector<HostileArchive>& archives) {
    const auto add = [&](std::string name, std::string entry, int error) {
        archives.push_back(Refused(std::move(name), File(std::move(entry), "evil"), error));
    };
    add("absolute name", "/private/canary/new", EPERM);
    add("absolute name with two slashes", "//private/canary/new", EPERM);
    add("name that leads up", "../new", EPERM);
    add("name that leads up in the middle", "a/../../new", EPERM);
    add("name that leads up and back", "a/../new", EPERM);
    add("name that is two dots", "..", EPERM);
    add("name that ends in two dots", "a/..", EPERM);
    add("name that leads up from here", "./.././../new", EPERM);
    add("name with both separators", "a/..\\..\\new", EINVAL);
    add("name with a line feed", "two\nlines", EINVAL);
    add("name with an escape", "\x1B[2Jnew", EINVAL);
    add("name of the unfinished", "a/.linefold-unfinished", EINVAL);
    add("empty name", "", EINVAL);
    add("part of 300 letters", std::string(300, 'n'), ENAMETOOLONG);
    add("part of 256 letters", "a/" + std::string(256, 'n') + "/b", ENAMETOOLONG);
    add("65 folders", Repeat("d/", 65) + "f", ENAMETOOLONG);
    add("5,000 letters that mean little", Repeat("./", 2500) + "f", ENAMETOOLONG);
    archives.push_back(Refused("folder that leads up", Folder("../new/"), EPERM));
    // A name with backslashes alone is another system's, and taken as that system means it.
    archives.push_back(
        Refused("backslashes that lead up", File("..\\..\\new", "evil"), EPERM, "../../new"));
    archives.push_back(Whole("backslashes", {File("a\\b", "x")}, {"d 0755 a ", "f 0644 a/b x"}));
    Entry odd = File("caf\xE9", "x");
    archives.push_back(Refused("name that is not UTF-8 as it says", odd, EILSEQ, ""));
    odd.flags = 0;
    archives.push_back(Whole("name that is not UTF-8", {odd}, {"f 0644 caf\xE9 x"}));
    archives.push_back(Whole("name in UTF-8",
                             {File("\xC3\xA9\xF0\x9F\x93\xB1", "x")},
                             {"f 0644 \xC3\xA9\xF0\x9F\x93\xB1 x"}));
    // What stands behind the NUL is nobody's name.
    archives.push_back(Whole(
        "name with a NUL", {File(std::string("file\0/../../new", 15), "x")}, {"f 0644 file x"}));
}

void AddLinks(std::vector<HostileArchive>& archives) {
    const auto refuse = [&](std::string name, const Entry& entry) {
        archives.push_back(Refused(std::move(name), entry, EPERM));
    };
    refuse("link to an absolute path", Link("link", "/private/canary/open"));
    refuse("link that leads out", Link("link", "../canary"));
    refuse("link that leads out of a folder", Link("a/link", "../../canary"));
    refuse("link that leads out behind a name", Link("link", "before/../../canary"));
    archives.push_back(Refused("link to nothing", Link("link", ""), EINVAL));
    archives.push_back(Refused("link with a backslash", Link("link", "..\\x"), EINVAL));
    archives.push_back(Broken("link to 70,000 letters", Link("link", std::string(70'000, 'x'))));
    archives.push_back(Whole("link, then through the link",
                             {Folder("d/"), Link("link", "d"), File("link/file", "evil")},
                             {"d 0755 d ", "l 0777 link d", LeftOut(ENOTDIR, "link/file")}));
    archives.push_back(
        Whole("link, then a folder of its name",
              {Folder("d/"), Link("link", "d"), Folder("link/"), kBehind},
              {kBehindLine, "d 0755 d ", "l 0777 link d", LeftOut(ENOTDIR, "link/")}));
    archives.push_back(Whole("link, then a file of its name",
                             {kBefore, Link("link", "before"), File("link", "new")},
                             {kBeforeLine, "f 0644 link new"}));
    archives.push_back(Whole("link to itself",
                             {Link("link", "link"), File("link/file", "evil")},
                             {"l 0777 link link", LeftOut(ENOTDIR, "link/file")}));
    // Each stays inside when its words are counted; together they would lead out.
    archives.push_back(
        Whole("links that lead out together",
              {Folder("a/b/"), Link("a/b/top", "../.."), Link("a/b/out", "top/../canary")},
              {"d 0755 a ", "d 0755 a/b ", "l 0777 a/b/top ../..", LeftOut(EPERM, "a/b/out")}));
    // PKWARE's field for Unix can name the target of a hard link.
    const std::string target = "/private/canary/secret";
    Entry hard = File("hard", "");
    hard.local.extra =
        Number(0x000D, 2) + Number(12 + target.size(), 2) + Number(0, 8) + Number(0, 4) + target;
    hard.central.extra = hard.local.extra;
    archives.push_back(
        Whole("hard link that leads out", {kBefore, hard}, {kBeforeLine, "f 0644 hard "}));
}

void AddModes(std::vector<HostileArchive>& archives) {
    archives.push_back(
        Whole("set-id bits",
              {File("user", "x", 04755),
               File("group", "x", 02755),
               File("both", "x", 06777),
               Folder("folder/", 07777)},
              {"f 0755 both x", "d 0755 folder ", "f 0755 group x", "f 0755 user x"}));
    archives.push_back(Whole("everybody may write",
                             {File("file", "x", 0666), Folder("d/", 01777)},
                             {"d 0755 d ", "f 0644 file x"}));
    for (const auto& [name, type] : {std::pair("character device", 0020000U),
                                     std::pair("block device", 0060000U),
                                     std::pair("socket", 0140000U)}) {
        Entry entry = File("special", "");
        entry.mode = type | 0666;
        archives.push_back(Refused(name, entry, EOPNOTSUPP));
    }
    Entry fifo = File("file", "x");
    fifo.mode = 0010644;  // what was read from a pipe when the archive was made
    archives.push_back(Whole("FIFO", {fifo}, {"f 0644 file x"}));
    Entry none = File("file", "x");
    none.mode = 0;
    none.system = 0;
    archives.push_back(Whole("no modes", {none}, {"f 0644 file x"}));
}

void AddDuplicates(std::vector<HostileArchive>& archives) {
    archives.push_back(
        Whole("one name twice", {File("file", "old"), File("file", "new")}, {"f 0644 file new"}));
    archives.push_back(Whole("names that differ in case",
                             {File("file", "a"), File("FILE", "b")},
                             {"f 0644 FILE b", "f 0644 file a"}));
    archives.push_back(Whole("file, then below it",
                             {File("a", "x"), File("a/b", "y")},
                             {"f 0644 a x", LeftOut(ENOTDIR, "a/b")}));
    archives.push_back(Whole("folder, then a file of its name",
                             {File("a/b", "y"), File("a", "x")},
                             {"d 0755 a ", "f 0644 a/b y", LeftOut(EISDIR, "a")}));
    archives.push_back(
        Whole("folder twice", {Folder("a/", 0700), Folder("a/", 0755)}, {"d 0700 a "}));
    archives.push_back(Refused("file in place of the destination", File("./.", "evil"), EISDIR));
    archives.push_back(Refused("link in place of the destination", Link(".", "evil"), EISDIR));
    archives.push_back(Whole("the destination itself", {Folder("./"), kBehind}, {kBehindLine}));
}

void AddLies(std::vector<HostileArchive>& archives) {
    const auto refused = [&](std::string name, int error, void (*change)(Entry & entry)) {
        Entry entry = File("file", "data that is stored");
        change(entry);
        archives.push_back(Refused(std::move(name), entry, error));
    };
    const auto broken = [&](std::string name, void (*change)(Entry & entry)) {
        Entry entry = File("file", "data that is stored");
        change(entry);
        archives.push_back(Broken(std::move(name), entry));
    };
    refused("bad checksum", EILSEQ, [](Entry& entry) { entry.crc = 1; });
    refused("unknown method", EOPNOTSUPP, [](Entry& entry) { entry.method = 77; });
    refused("bzip2", EOPNOTSUPP, [](Entry& entry) { entry.method = 12; });
    refused("LZMA with a dictionary of 4 GiB", EOPNOTSUPP, [](Entry& entry) {
        entry.method = 14;
        entry.data = "\x09\x14" + Number(5, 2) + "]" + Number(0xFFFFFFFF, 4) + "data of LZMA";
    });
    refused("encrypted", EILSEQ, [](Entry& entry) { entry.flags = 0x0801; });
    refused("less data than announced", EILSEQ, [](Entry& entry) {
        entry.method = 8;
        entry.data = std::string("\3\0", 2);
        entry.size = 5;
    });
    refused("more data than announced", EILSEQ, [](Entry& entry) {
        entry = Zeros("file", 100'000);
        entry.size = 70'000;
    });
    refused("another size in the header", EILSEQ, [](Entry& entry) { entry.local.size = 7; });
    refused("another checksum in the header", EILSEQ, [](Entry& entry) { entry.local.crc = 7; });
    broken("another method in the header", [](Entry& entry) { entry.local.method = 8; });
    broken("garbage instead of deflated data", [](Entry& entry) { entry.method = 8; });
    broken("deflated data that ends early", [](Entry& entry) {
        entry = Zeros("file", 100'000);
        entry.data.resize(entry.data.size() / 2);
    });
    Entry header = File("file", "data");
    header.local.name = "../new";
    archives.push_back(Refused("another name in the header", header, EPERM, "../new"));
    Entry record = File("file", "data");
    record.central.name = "../new";
    archives.push_back(Whole(
        "another name in the directory", {kBefore, record}, {kBeforeLine, "f 0644 file data"}));
    Entry nowhere = File("file", "data");
    nowhere.offset = 1;
    archives.push_back(Broken("no header where the directory says", nowhere));
}

void AddOverlaps(std::vector<HostileArchive>& archives) {
    Entry again = File("again", "one");
    again.offset = 0;
    again.hasHeader = false;
    archives.push_back(Whole("two records for one header", {kBefore, again}, {kBeforeLine}));
    // The data of the first one is the second one, with its header.
    const std::string second = Write(std::vector{kBehind});
    Entry outer = File("outer", second.substr(0, second.find("PK\1\2")));
    Entry inner = kBehind;
    inner.hasHeader = false;
    inner.offset = static_cast<std::uint32_t>(30 + outer.name.size());
    archives.push_back(Whole(
        "an entry inside another", {outer, inner}, {kBehindLine, "f 0644 outer " + outer.data}));
}

void AddEnds(std::vector<HostileArchive>& archives) {
    const auto unreadable = [&](std::string name, std::string bytes) {
        archives.push_back(Unreadable(std::move(name), std::move(bytes)));
    };
    const std::string whole = Write({kBefore, kBehind});
    unreadable("truncated by a byte", whole.substr(0, whole.size() - 1));
    unreadable("truncated in the directory", whole.substr(0, whole.size() - 60));
    unreadable("truncated in the data", whole.substr(0, 40));
    unreadable("first bytes alone", "PK\3\4");
    unreadable("garbage behind the first bytes", "PK\3\4" + std::string(5000, 'g'));
    unreadable("directory that is an entry",
               Write(Archive{.entries = {kBefore}, .directoryOffset = 0}));
    unreadable("directory outside of the file",
               Write(Archive{.entries = {kBefore}, .directoryOffset = 0x7FFFFFFF}));
    unreadable("directory of another size",
               Write(Archive{.entries = {kBefore}, .directorySize = 1}));
    unreadable("end of no directory",
               "PK\5\6" + Number(0, 4) + Number(1, 2) + Number(1, 2) + Number(0, 10));
    Entry torn = kBefore;
    torn.central.extra = Number(1, 2) + Number(999, 2);
    unreadable("field longer than all of them", Write({torn}));
    archives.push_back({"count of another",
                        Write(Archive{.entries = {kBefore, kBehind}, .count = 1}),
                        {kBeforeLine, kBehindLine}});
    archives.push_back({"no entries", Write(std::vector<Entry>{}), {}});
    archives.push_back({"archive in the comment",
                        Write(Archive{.entries = {kBefore}, .comment = Write({kBehind})}),
                        {kBehindLine}});
}

void AddLargeOnes(std::vector<HostileArchive>& archives) {
    archives.push_back(Whole("zip64", {Zip64(kBefore, 3, 3)}, {kBeforeLine}));
    for (const std::uint64_t size : {~std::uint64_t{0}, std::uint64_t{1} << 63}) {
        archives.push_back(Unreadable("zip64 of " + std::to_string(size) + " bytes",
                                      Write({kBefore, Zip64(kBehind, size, size)})));
    }
    archives.push_back(Whole("zip64 of 1 EiB",
                             {kBefore, Zip64(kBehind, std::uint64_t{1} << 60, 3)},
                             {kBeforeLine, Fatal(EFBIG)}));
    Entry bomb = Zeros("bomb", 2'000'000'000);
    archives.push_back(Whole("2 GB of zeros", {kBefore, bomb}, {kBeforeLine, Fatal(EFBIG)}));
    bomb.size = 3;
    archives.push_back(Refused("2 GB of zeros that say they are 3", bomb, EILSEQ));
}

}  // namespace

std::vector<HostileArchive> HostileArchives() {
    std::vector<HostileArchive> archives;
    AddNames(archives);
    AddLinks(archives);
    AddModes(archives);
    AddDuplicates(archives);
    AddLies(archives);
    AddOverlaps(archives);
    AddEnds(archives);
    AddLargeOnes(archives);
    return archives;
}

}  // namespace zip
