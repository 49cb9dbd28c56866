#include "tools/lfhelper/Subcommands.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <optional>
#include <vector>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "tools/lfhelper/DoctorCommand.h"
#include "tools/lfhelper/FileCommands.h"
#include "tools/lfhelper/HeartbeatCommands.h"
#include "tools/lfhelper/HexDump.h"
#include "tools/lfhelper/LocationCommands.h"
#include "tools/lfhelper/ParseNumber.h"
#include "tools/lfhelper/PreferenceCommands.h"
#include "tools/lfhelper/RadioCommands.h"
#include "tools/lfhelper/UpdateCommands.h"
#include "tools/lfhelper/VoicemailCommands.h"

namespace lfhelper {
namespace {

Preparation PrepareCheckIn(const CommandLine& /*line*/) {
    return {.request = [](LFMobileHelper* helper) {
        return Answer{.code = LFMobileHelperCheckIn(helper)};
    }};
}

Preparation PrepareLinkCarrierBundle(const CommandLine& line) {
    const std::string domain = line.operands.size() > 2 ? line.operands[2] : "";
    return {.request = [target = line.operands[0], link = line.operands[1], domain](
                           LFMobileHelper* helper) {
        Answer answer{.code = LFMobileHelperLinkCarrierBundle(
                          helper, target.c_str(), link.c_str(), domain.c_str())};
        answer.fields.add("target", target);
        answer.fields.add("link", link);
        answer.fields.add("domain", domain);
        return answer;
    }};
}

Preparation PrepareCreateSymlink(const CommandLine& line) {
    return {.request = [target = line.operands[0],
                        link = line.operands[1]](LFMobileHelper* helper) {
        Answer answer{.code = LFMobileHelperCreateSymlink(helper, target.c_str(), link.c_str())};
        answer.fields.add("target", target);
        answer.fields.add("link", link);
        return answer;
    }};
}

Preparation PrepareRemovePreferenceDomain(const CommandLine& line) {
    const std::string domain = line.operands.size() > 1 ? line.operands[1] : "";
    return {.request = [path = line.operands[0], domain](LFMobileHelper* helper) {
        Answer answer{
            .code = LFMobileHelperRemovePreferenceDomain(helper, path.c_str(), domain.c_str())};
        answer.fields.add("path", path);
        answer.fields.add("domain", domain);
        return answer;
    }};
}

std::vector<std::byte> MakeMessage(const platform::MachMsgHeader& header, ByteSpan body) {
    std::vector<std::byte> message(sizeof header + body.size());
    platform::Store(std::span(message), 0, header);
    std::ranges::copy(body, message.begin() + sizeof header);
    return message;
}

JsonObject HeaderFields(ByteSpan reply) {
    const auto header = platform::Load<platform::MachMsgHeader>(reply, 0);
    JsonObject fields;
    fields.add("bits", std::int64_t{header.bits});
    fields.add("size", std::int64_t{header.size});
    fields.add("id", std::int64_t{header.id});
    return fields;
}

Answer AnswerOfReply(ByteSpan reply, bool hasDescriptor) {
    Answer answer{.code = ReturnCodeOf(reply).value_or(LF_MOBILE_HELPER_ERROR_INVALID_REPLY),
                  .text = AnnotatedReply(reply)};
    if (hasDescriptor) {
        answer.text += "and a descriptor beside it\n";
    }
    if (reply.size() >= sizeof(platform::MachMsgHeader)) {
        answer.fields.add("header", HeaderFields(reply));
    }
    answer.fields.add("reply", ToHex(reply));
    answer.fields.add("descriptors", std::int64_t{hasDescriptor ? 1 : 0});
    return answer;
}

Answer SendAndDump(LFMobileHelper* helper, std::span<const std::byte> message) {
    // A reply, the data behind it, and as much again for one that breaks the rules.
    constexpr std::size_t kCapacity =
        std::size_t{2} * (platform::kMaxReplySize + platform::kMaxInlineData);
    std::vector<std::byte> reply(kCapacity);
    std::size_t size = 0;
    int descriptor = -1;
    const std::int32_t code = LFMobileHelperSendMessage(
        helper, message.data(), message.size(), reply.data(), reply.size(), &size, &descriptor);
    if (descriptor >= 0) {
        (void)close(descriptor);
    }
    return code == LF_MOBILE_HELPER_SUCCESS
               ? AnswerOfReply(ByteSpan(reply).first(size), descriptor >= 0)
               : Answer{.code = code};
}

Preparation PrepareRaw(const CommandLine& line) {
    const auto id = ParseNumber<std::int32_t>(line.operands[0]);
    if (!id) {
        return {.error = "ID must be a number of 32 bits, not \"" + line.operands[0] + "\""};
    }
    const auto body = FromHex(line.operands.size() > 1 ? line.operands[1] : "");
    if (!body) {
        return {.error = "HEX must be pairs of hexadecimal digits"};
    }
    const auto claimed = line.value("claim-size");
    const auto size =
        claimed ? ParseNumber<std::uint32_t>(*claimed)
                : static_cast<std::uint32_t>(sizeof(platform::MachMsgHeader) + body->size());
    if (!size) {
        return {.error = "the value of --claim-size must be a number of 32 bits"};
    }
    const std::uint32_t bits = line.has("complex") ? platform::MACH_MSGH_BITS_COMPLEX : 0;
    const auto message = MakeMessage({.bits = bits, .size = *size, .id = *id}, *body);
    return {.request = [message](LFMobileHelper* helper) { return SendAndDump(helper, message); }};
}

constexpr auto kSubcommands = std::to_array<Subcommand>({
    {"check-in",
     "",
     "ask whether the service is there and takes this caller",
     "Connects and checks in, and asks for nothing else.\n"
     "\n"
     "Examples:\n"
     "  lfhelper check-in\n"
     "  lfhelper --group linefold-telephony --json check-in\n",
     0,
     0,
     PrepareCheckIn},
    {"doctor",
     "",
     "check this system and say what keeps the service from its work",
     "Looks at all that the service needs, and prints a line for each: \"ok\", \"note\" for what "
     "may\n"
     "well be so, \"problem\" for what must be mended, with what to do about it. It changes "
     "nothing "
     "and\n"
     "asks the service for nothing but a check-in. As root it sees most; what it cannot see it "
     "says "
     "in\n"
     "a note.\n"
     "\n"
     "The exit status is 1 when there is a problem. With --json, \"checks\" holds an object for "
     "each\n"
     "line: \"check\", \"level\", \"finding\", and \"remedy\", which is null where there is "
     "nothing to do.\n"
     "\n"
     "Examples:\n"
     "  lfhelper doctor\n"
     "  lfhelper doctor --group linefold-telephony --json\n",
     0,
     0,
     PrepareDoctor},
    {"link-carrier-bundle",
     "TARGET LINK [DOMAIN]",
     "point a carrier or operator bundle link at a bundle",
     "Replaces the link LINK, which must be one of the bundle links, by one that points at "
     "TARGET,\n"
     "and drops the cached preferences of DOMAIN.\n"
     "\n"
     "Examples:\n"
     "  lfhelper link-carrier-bundle '/System/Library/Carrier Bundles/Example.bundle' \\\n"
     "      '/private/var/mobile/Library/Carrier Bundle.bundle' com.vendra.carrier\n",
     2,
     3,
     PrepareLinkCarrierBundle},
    {"create-symlink",
     "TARGET LINK",
     "make a symbolic link, in place of a file that may be there",
     "Removes what is at LINK and makes a symbolic link to TARGET there.\n"
     "\n"
     "Examples:\n"
     "  lfhelper create-symlink /private/var/mobile/Library/Logs /private/var/mobile/logs\n",
     2,
     2,
     PrepareCreateSymlink},
    {"remove-preference-domain",
     "PATH [DOMAIN]",
     "remove the file of a preference domain",
     "Drops the cached preferences of DOMAIN, then removes PATH, which must be a carrier path.\n"
     "\n"
     "Examples:\n"
     "  lfhelper remove-preference-domain \\\n"
     "      /private/var/mobile/Library/Preferences/com.vendra.carrier.plist com.vendra.carrier\n",
     1,
     2,
     PrepareRemovePreferenceDomain},
    {"preferences get",
     "[--application] [--plist] DOMAIN KEY",
     "show a preference value of the mobile user",
     "Shows a text, number or boolean as such and any other value as an XML property list.\n"
     "\n"
     "  --application    look where an application does: in DOMAIN, in .GlobalPreferences, and in\n"
     "                   the same two of /Library/Preferences; the first value found counts\n"
     "  --plist          show every value as an XML property list\n"
     "\n"
     "A key without a value is no failure of the service, nor is it an empty text: nothing is\n"
     "printed but a note on standard error, and the exit status is 4, so that a script can tell.\n"
     "With --json, \"type\" tells the kind; \"value\" holds texts, booleans and finite numbers "
     "and\n"
     "is null when there is no value; anything else stands as an XML property list in \"plist\".\n"
     "A list of more than 16 MiB is shown as it is, with the type \"plist\".\n"
     "\n"
     "Examples:\n"
     "  lfhelper preferences get com.vendra.carrier_2 CarrierName\n"
     "  lfhelper preferences get --application --json com.vendra.carrier_2 CarrierName\n",
     2,
     2,
     PreparePreferencesGet},
    {"preferences set",
     "[--type TYPE] DOMAIN KEY VALUE",
     "store a preference value of the mobile user",
     "Stores VALUE, or what standard input holds when VALUE is -, at most 16 MiB.\n"
     "\n"
     "  --type TYPE    what VALUE is:\n"
     "      string     a text in UTF-8 (the default)\n"
     "      integer    a decimal number of 64 bits, or a hexadecimal one behind 0x\n"
     "      real       a decimal number, inf or nan\n"
     "      boolean    true or false\n"
     "      date       such as 2001-01-01T00:00:00Z\n"
     "      data       bytes in base64, as the program base64 writes them\n"
     "      plist      a property list of any kind, XML or binary, sent as it is\n"
     "\n"
     "One line feed at the end of standard input is not part of the value, but for a plist. A\n"
     "VALUE that begins with - and is neither - nor a number goes behind --. The service answers\n"
     "success also when it could not write the file of the domain: its log tells.\n"
     "\n"
     "Examples:\n"
     "  lfhelper preferences set com.vendra.carrier_2 CarrierName 'Example Mobile'\n"
     "  lfhelper preferences set --type integer com.vendra.carrier_2 SignalBars -4\n"
     "  base64 icon.png | lfhelper preferences set --type data com.vendra.carrier_2 Icon -\n"
     "  lfhelper preferences set --type plist com.vendra.carrier_2 Apns - <apns.plist\n",
     3,
     3,
     PreparePreferencesSet},
    {"preferences remove",
     "DOMAIN KEY",
     "remove a preference value of the mobile user",
     "Removes the value of KEY; that there is none is a success too.\n"
     "\n"
     "Examples:\n"
     "  lfhelper preferences remove com.vendra.carrier_2 CarrierName\n",
     2,
     2,
     PreparePreferencesRemove},
    {"copy-file",
     "SOURCE-DIRECTORY DESTINATION-DIRECTORY NAME",
     "copy a file into a carrier-bundle directory",
     "Copies SOURCE-DIRECTORY/NAME to DESTINATION-DIRECTORY/NAME, which must be a carrier path, "
     "and\n"
     "gives it to the mobile user. The destination directory is made if it is missing.\n"
     "\n"
     "When the service did not do it the exit status is 1; its log tells why.\n"
     "\n"
     "Examples:\n"
     "  lfhelper copy-file /tmp '/private/var/mobile/Library/Carrier Bundles' Example.plist\n",
     3,
     3,
     PrepareCopyFile},
    {"move-directory",
     "SOURCE DESTINATION-DIRECTORY NAME",
     "move a directory into a carrier-bundle directory",
     "Moves SOURCE to DESTINATION-DIRECTORY/NAME, which must be a carrier path where nothing is. "
     "The\n"
     "destination directory is made if it is missing, also when the path is refused.\n"
     "\n"
     "When the service did not do it the exit status is 1; its log tells why.\n"
     "\n"
     "Examples:\n"
     "  lfhelper move-directory /private/var/tmp/Example.bundle \\\n"
     "      '/private/var/mobile/Library/Carrier Bundles' Example.bundle\n",
     3,
     3,
     PrepareMoveDirectory},
    {"copy-log-directory",
     "SOURCE",
     "copy logs into the crash-report folder",
     "Copies a file or directory into Library/Logs/CrashReporter of the mobile user.\n"
     "\n"
     "When the service did not do it the exit status is 1; its log tells why.\n"
     "\n"
     "Examples:\n"
     "  lfhelper copy-log-directory /private/var/tmp/baseband-logs\n",
     1,
     1,
     PrepareCopyLogDirectory},
    {"copy-archive",
     "SOURCE DESTINATION",
     "expand a ZIP archive, or copy anything else",
     "Expands SOURCE into the directory DESTINATION if its first bytes are those of a ZIP "
     "archive;\n"
     "otherwise copies it: what a directory contains goes into DESTINATION, a file to DESTINATION "
     "or\n"
     "inside it. A directory DESTINATION is made if it is missing.\n"
     "\n"
     "Files that the service had to leave out are told in its log and change nothing else. When "
     "it\n"
     "had to stop, what was made until then stays, and the exit status is 1; its log tells why.\n"
     "\n"
     "Examples:\n"
     "  lfhelper copy-archive /tmp/Example.crbn /private/var/tmp/Example\n",
     2,
     2,
     PrepareCopyArchive},
    {"load-plist",
     "PATH",
     "show a property-list file",
     "Writes the dictionary in the file PATH to standard output, as an XML property list. With "
     "--json\n"
     "it stands in \"plist\".\n"
     "\n"
     "Examples:\n"
     "  lfhelper load-plist '/private/var/mobile/Library/Carrier Bundle.bundle/Info.plist'\n",
     1,
     1,
     PrepareLoadPlist},
    {"voicemail set-token",
     "[--key KEY] TOKEN",
     "store a voicemail token",
     "Stores the access token, or one under a key, in place of an earlier one: a text in UTF-8 of "
     "at\n"
     "most 256 bytes. When TOKEN is -, standard input holds it, without the line feed at its end. "
     "A\n"
     "token is a secret: other users can see the arguments of a process, but not its input.\n"
     "\n"
     "  --key KEY    store it under this key, also a text of at most 256 bytes\n"
     "\n"
     "A token of 256 bytes is stored but cannot be read by \"voicemail get-token\". The service\n"
     "answers success also when it could not write its store: its log tells.\n"
     "\n"
     "Examples:\n"
     "  lfhelper voicemail set-token - <token-file\n"
     "  lfhelper voicemail set-token --key +15550100 - <token-file\n",
     1,
     1,
     PrepareVoicemailSetToken},
    {"voicemail get-token",
     "[--key KEY]",
     "show a voicemail token",
     "Shows the access token, or the one under a key. That there is none, or one of 256 bytes, "
     "which "
     "no\n"
     "reply holds, is no failure of the service: nothing is printed but a note on standard error, "
     "and\n"
     "the exit status is 4. With --json, \"token\" is null then.\n"
     "\n"
     "  --key KEY    show the token under this key\n"
     "\n"
     "Examples:\n"
     "  lfhelper voicemail get-token\n"
     "  lfhelper voicemail get-token --key +15550100\n",
     0,
     0,
     PrepareVoicemailGetToken},
    {"voicemail clear-token",
     "",
     "forget the voicemail token, and no token under a key",
     "Forgets the access token; that there is none is a success too. Tokens under keys stay.\n"
     "\n"
     "Examples:\n"
     "  lfhelper voicemail clear-token\n",
     0,
     0,
     PrepareVoicemailClearToken},
    {"voicemail remove-all",
     "",
     "forget all voicemail tokens",
     "Forgets the access token and the tokens under all keys.\n"
     "\n"
     "Examples:\n"
     "  lfhelper voicemail remove-all\n",
     0,
     0,
     PrepareVoicemailRemoveAll},
    {"voicemail is-subscribed",
     "",
     "ask whether the subscriber uses visual voicemail",
     "Shows \"subscribed\" or \"not subscribed\", which is the answer too where the system has no\n"
     "visual voicemail. The exit status is 0 in both cases.\n"
     "\n"
     "Examples:\n"
     "  lfhelper voicemail is-subscribed\n"
     "  lfhelper --json voicemail is-subscribed\n",
     0,
     0,
     PrepareVoicemailIsSubscribed},
    {"country-code",
     "",
     "show the country code that is configured",
     "Shows the country code of the geocoding services' configuration. That there is none is no\n"
     "failure of the service: the exit status is 4 then.\n"
     "\n"
     "Examples:\n"
     "  lfhelper country-code\n"
     "  lfhelper --json country-code\n",
     0,
     0,
     PrepareCountryCode},
    {"civic-address",
     "[--wait] LATITUDE LONGITUDE",
     "have the civic address of a place sent to the telephony daemon",
     "Asks for the country code, state, city and postal code of a place, in degrees. The service\n"
     "takes the request and sends the result to the telephony daemon, within about 5 seconds.\n"
     "\n"
     "  --wait    wait for the result in the telephony daemon's place, at most 10 seconds, and "
     "show\n"
     "            it. While the telephony daemon runs this cannot be: nothing is asked, and the\n"
     "            exit status is 3. It is 1 when no result comes.\n"
     "\n"
     "A number like -.5 goes behind --, or is written -0.5.\n"
     "\n"
     "Examples:\n"
     "  lfhelper civic-address 51.5007 -0.1246\n"
     "  lfhelper civic-address --wait --json 51.5007 -0.1246\n",
     2,
     2,
     PrepareCivicAddress},
    {"wan-ip",
     "[--wait]",
     "have this device's public address sent to the telephony daemon",
     "Asks for the address under which this device is seen from the network outside. The service\n"
     "takes the request and sends the result to the telephony daemon, within about 5 seconds; an\n"
     "empty address means that it could not be found out.\n"
     "\n"
     "  --wait    wait for the result in the telephony daemon's place, at most 10 seconds, and "
     "show\n"
     "            it. While the telephony daemon runs this cannot be: nothing is asked, and the\n"
     "            exit status is 3. It is 1 when no result comes.\n"
     "\n"
     "Examples:\n"
     "  lfhelper wan-ip\n"
     "  lfhelper wan-ip --wait\n",
     0,
     0,
     PrepareWanIp},
    {"heartbeat",
     "STATE",
     "start or stop the echo requests over the cellular interface",
     "With STATE \"on\" the service sends an echo request over pdp_ip0 at once and then every two\n"
     "seconds, over whatever interface leads to its host while there is no pdp_ip0, until STATE "
     "is\n"
     "\"off\". It answers at once; what becomes of the requests is not told anywhere.\n"
     "\n"
     "A heartbeat belongs to the service and not to the caller: it goes on when this command "
     "ends,\n"
     "and keeps the service from leaving. \"off\" ends that, whoever says it. Each \"on\" while "
     "it is\n"
     "on begins the rhythm anew, and keeps the service for good: then it ends when it is told to "
     "end\n"
     "(SIGTERM), and no more by itself. \"off\" while it is off changes nothing.\n"
     "\n"
     "Examples:\n"
     "  lfhelper heartbeat on\n"
     "  lfhelper heartbeat off\n",
     1,
     1,
     PrepareHeartbeat},
    {"radio-logging",
     "on|off|N",
     "switch the logging of the radio manager",
     "Has the radio manager log everything (on) or errors alone (off). A number is sent as it is:\n"
     "0 switches off, any other on. The service answers success also where no radio manager runs.\n"
     "\n"
     "Examples:\n"
     "  lfhelper radio-logging on\n"
     "  lfhelper radio-logging 0\n",
     1,
     1,
     PrepareRadioLogging},
    {"update-databases",
     "[--types TYPES] [--wait] [--timeout SECONDS]",
     "have the service databases brought up to date",
     "Has the service compare the installed databases with the server's index, and install what\n"
     "differs. The service takes the request and sends the outcome to the telephony daemon.\n"
     "\n"
     "  --types TYPES      names of gsm, umts, cdma, lte and scdma with commas between them, or "
     "all\n"
     "                     (the default), or a mask of their bits, such as 12 or 0xc\n"
     "  --wait             ask for one type after the other, wait for each outcome in the "
     "telephony\n"
     "                     daemon's place, and show it. While the telephony daemon runs this "
     "cannot\n"
     "                     be: nothing is asked, and the exit status is 3.\n"
     "  --timeout SECONDS  wait at most so long in all (default: 300)\n"
     "\n"
     "With --wait the exit status is 0 when each type was updated or needed no update, and 1 when\n"
     "one failed or the time was over; then too the outcomes that came are shown. A type whose\n"
     "entry in the index has no URL has no outcome at all. A failure, or that nothing was to be\n"
     "done, may be the end of a request that was made before: they name no type.\n"
     "\n"
     "Examples:\n"
     "  lfhelper update-databases --types gsm,lte\n"
     "  lfhelper update-databases --wait --timeout 60\n"
     "  lfhelper update-databases --types gsm --wait --json\n",
     0,
     0,
     PrepareUpdateDatabases},
    {"raw",
     "[--complex] [--claim-size N] ID [HEX]",
     "send a message as it is, and show the reply field by field",
     "Checks in, then sends a message to the private port: a header with the id ID (decimal, or\n"
     "hexadecimal behind 0x) and the bytes HEX behind it, where blanks and colons may stand "
     "between\n"
     "the bytes. The message is not looked at before.\n"
     "\n"
     "  --complex         set the bit that announces a descriptor\n"
     "  --claim-size N    write N as the size of the message instead of the true one\n"
     "\n"
     "Examples:\n"
     "  lfhelper raw 8683561\n"
     "  lfhelper raw 8683562 '0000000001000000 01000000'\n"
     "  lfhelper raw --complex --claim-size 568 0x848023\n",
     1,
     2,
     PrepareRaw},
});

}  // namespace

std::span<const Subcommand> Subcommands() {
    return kSubcommands;
}

const Subcommand* FindSubcommand(std::string_view name) {
    const auto found = std::ranges::find(kSubcommands, name, &Subcommand::name);
    return found == kSubcommands.end() ? nullptr : &*found;
}

}  // namespace lfhelper
