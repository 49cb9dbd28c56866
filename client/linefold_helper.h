/* The client side of LinefoldMobileHelper: one call for each thing that the service does.
 *
 *     LFMobileHelper *helper = LFMobileHelperCreate();
 *     int32_t code = LFMobileHelperCreateSymlink(helper, "/target", "/path/of/the/link");
 *     if (code != 0) {
 *         fprintf(stderr, "%s\n", LFMobileHelperErrorString(code));
 *     }
 *     LFMobileHelperDestroy(helper);
 *
 * Who may call. The service decides by the effective group that the process had when it connected:
 * the group must be entitled in /etc/linefold/entitlements. Others get
 * LF_MOBILE_HELPER_NOT_ENTITLED from the first call.
 *
 * Results. Every call returns an int32_t: 0 for success, a code of the service, or an
 * error of this library; all stand in LFMobileHelperCode. The errors of the library begin with
 * LF_MOBILE_HELPER_ERROR_ and lie where no code of the service does.
 *
 * Out values. A call sets every out value at its start to "nothing" (NULL and size 0, the empty
 * text, 0) and fills it on success only, so a value that is read in spite of an error is harmless.
 *
 * Arguments. Texts are NUL-terminated and must not be NULL (the empty text is one). Each travels
 * in a field of fixed size, 256 or 1024 bytes as named at the call, without a terminator. A longer
 * text is refused with LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG and nothing is sent. At calls that
 * say "the service cuts byte N", a text that fills its field loses its last byte there.
 *
 * Threads. All calls may be made from any thread, also on one handle, where they run one after the
 * other. Only LFMobileHelperDestroy needs the handle for itself. Requests take as long as the
 * service needs; no call has a time-out. Signals do not interrupt a call, and SIGPIPE is never
 * raised.
 *
 * Processes. Every descriptor of the library is closed on exec. After fork the child may go on with
 * the handle, if no other thread was inside a call when the process forked: the first call in the
 * child connects anew, and the parent's connection stays the parent's. The service counts the
 * parent as alive until the child, too, has closed its copies (by such a call, by exec or exit).
 *
 * Connection. The first call connects and checks in. The service leaves when it is idle; a
 * connection that it did not take any more is made again, for about two seconds at most. A request
 * that could not be delivered checks in anew and is sent once more. A request whose reply was lost
 * is not repeated, since it may have been carried out: LF_MOBILE_HELPER_ERROR_CONNECTION_LOST. The
 * next call connects again.
 */
#ifndef LINEFOLD_HELPER_H
#define LINEFOLD_HELPER_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define LF_MOBILE_HELPER_EXPORT __attribute__((visibility("default")))

/* A client of the service: at most one connection. */
typedef struct LFMobileHelper LFMobileHelper;

#define LF_MOBILE_HELPER_DEFAULT_SERVICE_PATH "/run/linefold/com.vendra.linefold.mobile-helper"

/* Bytes that a buffer for a token, and for a country code, must have: the field and a NUL. */
#define LF_MOBILE_HELPER_TOKEN_SIZE 257
#define LF_MOBILE_HELPER_COUNTRY_CODE_SIZE 65

/* The largest value that LFMobileHelperSetPreferenceValue takes: 16 MiB. */
#define LF_MOBILE_HELPER_MAX_VALUE_SIZE 16777216

/* Every result of a call. */
/* NOLINTBEGIN(readability-identifier-naming): C has no namespaces. */
enum LFMobileHelperCode {
    /* ---- What the service answers ---- */

    LF_MOBILE_HELPER_SUCCESS = 0,
    /* The service found no memory for its answer, or the answer is larger than 64 MiB. */
    LF_MOBILE_HELPER_NO_SPACE = 3,
    /* The operation failed, or an argument is not UTF-8 or no property list where it must be. */
    LF_MOBILE_HELPER_FAILURE = 5,
    /* The service has no descriptor or memory left, or the value is larger than 16 MiB. */
    LF_MOBILE_HELPER_RESOURCE_SHORTAGE = 6,
    /* The path is not one that the service may change. */
    LF_MOBILE_HELPER_NO_ACCESS = 8,
    /* The property-list file is missing or holds no dictionary. */
    LF_MOBILE_HELPER_NO_DATA = 9,
    /* The group of the caller is not entitled. */
    LF_MOBILE_HELPER_NOT_ENTITLED = 35,
    /* A message has a descriptor of the wrong type, or two sizes in it disagree. */
    LF_MOBILE_HELPER_TYPE_ERROR = -300,
    /* No routine has this message id. */
    LF_MOBILE_HELPER_BAD_ID = -303,
    /* A message has the wrong size or form, or what came beside it is missing or unusable. */
    LF_MOBILE_HELPER_BAD_ARGUMENTS = -304,
    /* The trailer of a message does not say who sent it. */
    LF_MOBILE_HELPER_TRAILER_ERROR = -309,

    /* ---- What this library finds wrong ---- */

    /* An argument is NULL that must not be, or a size is not 0 where the data is NULL. */
    LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT = 0x10000002,
    /* There is no service at the path, or it did not take the connection in two seconds. */
    LF_MOBILE_HELPER_ERROR_NO_SERVICE = 0x10000003,
    /* The path of the service is longer than a socket address holds (107 bytes). */
    LF_MOBILE_HELPER_ERROR_PATH_TOO_LONG = 0x10000004,
    /* This process may not connect to the path. */
    LF_MOBILE_HELPER_ERROR_NO_PERMISSION = 0x10000005,
    /* What is at the path is not a socket for messages. */
    LF_MOBILE_HELPER_ERROR_NOT_A_SERVICE = 0x1000000a,
    /* This process or the system has no memory, descriptor or buffer left. */
    LF_MOBILE_HELPER_ERROR_NO_RESOURCES = 0x1000000d,
    /* A text or value is too long for its field; nothing was sent. */
    LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG = 0x10000010,
    /* The reply is larger than the caller's buffer (raw messages only). */
    LF_MOBILE_HELPER_ERROR_REPLY_TOO_LARGE = 0x10004004,
    /* The reply breaks the protocol. The request may have been carried out. */
    LF_MOBILE_HELPER_ERROR_INVALID_REPLY = 0x10004008,
    /* The connection ended before the reply. The request may have been carried out. */
    LF_MOBILE_HELPER_ERROR_CONNECTION_LOST = 0x10004009
};

/* NOLINTEND(readability-identifier-naming) */

/* What a code means, in one English sentence without a full stop. Never NULL; constant. */
LF_MOBILE_HELPER_EXPORT const char* LFMobileHelperErrorString(int32_t code);

/* The short name of a code, such as "NOT_ENTITLED" or "ERROR_NO_SERVICE"; "UNKNOWN" for a code that
 * is not documented above. Never NULL; constant. */
LF_MOBILE_HELPER_EXPORT const char* LFMobileHelperErrorName(int32_t code);

/* ---- The handle ----------------------------------------------------------------------------- */

/* A client of the service at the default path. Nothing is connected yet. NULL without memory. */
LF_MOBILE_HELPER_EXPORT LFMobileHelper* LFMobileHelperCreate(void);

/* The same for another path, which is copied; NULL stands for the default path. A path that is too
 * long is reported by the first call. */
LF_MOBILE_HELPER_EXPORT LFMobileHelper* LFMobileHelperCreateWithPath(const char* servicePath);

/* Closes the connection, which ends the check-in, and frees the handle. NULL is harmless. */
LF_MOBILE_HELPER_EXPORT void LFMobileHelperDestroy(LFMobileHelper* helper);

/* Checks in, if this handle has not. Each call below does so itself; this one tells whether the
 * service is there and takes the caller, without asking for anything.
 * Errors: NOT_ENTITLED, RESOURCE_SHORTAGE, NO_SPACE, FAILURE from the service; all of the
 * library's but ARGUMENT_TOO_LONG and REPLY_TOO_LARGE. Every call below can return these too. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCheckIn(LFMobileHelper* helper);

/* Frees data that a call of this library gave to the caller. NULL is harmless. */
LF_MOBILE_HELPER_EXPORT void LFMobileHelperFree(void* data);

/* ---- Voicemail tokens: texts of at most 256 bytes of UTF-8 ---------------------------------- */

/* Stores the access token. The result is 0 also when the service could not write its store: its log
 * tells. A token of 256 bytes is stored, but no reply holds it. FAILURE: the token is not UTF-8. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperSetVoicemailToken(LFMobileHelper* helper,
                                                                const char* token);

/* Stores a token under a key, likewise. The service keeps at most 1024 keys. FAILURE: one of them
 * is not UTF-8. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperSetVoicemailTokenForKey(LFMobileHelper* helper,
                                                                      const char* key,
                                                                      const char* token);

/* Forgets the access token; tokens under keys stay. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperClearVoicemailToken(LFMobileHelper* helper);

/* Forgets the access token, then every record. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperRemoveAllVoicemailRecords(LFMobileHelper* helper);

/* Reads the token under a key into the caller's buffer, always NUL-terminated; the empty text when
 * there is none, or one of 256 bytes. FAILURE: the key is not UTF-8. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCopyVoicemailTokenForKey(
    LFMobileHelper* helper, const char* key, char token[LF_MOBILE_HELPER_TOKEN_SIZE]);

/* Reads the access token into the caller's buffer, likewise. */
LF_MOBILE_HELPER_EXPORT int32_t
LFMobileHelperCopyVoicemailToken(LFMobileHelper* helper, char token[LF_MOBILE_HELPER_TOKEN_SIZE]);

/* Sets *isSubscribed to other than 0 when the subscriber uses visual voicemail. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperIsVoicemailSubscribed(LFMobileHelper* helper,
                                                                    int32_t* isSubscribed);

/* ---- Preferences of the mobile user: domain and key of at most 256 bytes -------------------- */

/* Stores a value, given as a serialised property list, XML or binary, of at most
 * LF_MOBILE_HELPER_MAX_VALUE_SIZE bytes. The data stays the caller's, who may free it afterwards.
 * Mind the size: data of exactly one byte, whatever the byte, is no value but removes the key. No
 * property list is that short; LFMobileHelperRemovePreferenceValue says it by name.
 * The result is 0 also when the service could not write the file of the domain, or the domain
 * cannot name a file (it is empty, has a "/", or more than 249 bytes): its log tells.
 * FAILURE: the value is not a property list (an empty one is none), or domain or key is not UTF-8.
 * ERROR_ARGUMENT_TOO_LONG: the value is too large. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperSetPreferenceValue(LFMobileHelper* helper,
                                                                 const char* domain,
                                                                 const char* key,
                                                                 const void* value,
                                                                 size_t valueSize);

/* Removes the value of a key; a key without one is a success too. The result is 0 also when the
 * file could not be written, as above. FAILURE: domain or key is not UTF-8. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperRemovePreferenceValue(LFMobileHelper* helper,
                                                                    const char* domain,
                                                                    const char* key);

/* Reads a value as an XML property list of *valueSize bytes, without a NUL behind them. *value is
 * the caller's, who frees it with LFMobileHelperFree. A key without a value is a success with
 * *value NULL and *valueSize 0; a value is never NULL.
 * FAILURE: domain or key is not UTF-8, or the value cannot be written as XML. NO_SPACE. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCopyPreferenceValue(
    LFMobileHelper* helper, const char* domain, const char* key, void** value, size_t* valueSize);

/* The same, with the search list of an application. The first of these that has the key gives the
 * value: the domain, the mobile user's domain for all applications (".GlobalPreferences"), and the
 * same two of all users in /Library/Preferences. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCopyAppPreferenceValue(
    LFMobileHelper* helper, const char* domain, const char* key, void** value, size_t* valueSize);

/* ---- Carrier bundles: texts of at most 1024 bytes, of which the service cuts byte 1024 ------ */

/* Points a carrier or operator bundle link at a bundle and makes readers of the preference domain
 * see the new settings. An empty domain leaves preferences alone. The target is not looked at.
 * NO_ACCESS: the link path is none of the bundle links, or is a folder. FAILURE: no link made. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperLinkCarrierBundle(LFMobileHelper* helper,
                                                                const char* target,
                                                                const char* linkPath,
                                                                const char* domain);

/* Makes a symbolic link, in place of a file that may be there. FAILURE: no link made. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCreateSymlink(LFMobileHelper* helper,
                                                            const char* target,
                                                            const char* linkPath);

/* Removes the file of a preference domain. The caches of the domain, unless it is the empty text,
 * are dropped first and whatever happens then.
 * NO_ACCESS: the path is no carrier path. FAILURE: the file could not be removed. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperRemovePreferenceDomain(LFMobileHelper* helper,
                                                                     const char* path,
                                                                     const char* domain);

/* ---- Files: texts of at most 256 bytes. The first three cut byte 256 of each text ----------- */

/* Copies sourceDirectory/name to destinationDirectory/name and gives it to the mobile user. The
 * result is 0 also when that failed: *isDone is other than 0 when it succeeded. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCopyFile(LFMobileHelper* helper,
                                                       const char* sourceDirectory,
                                                       const char* destinationDirectory,
                                                       const char* name,
                                                       int32_t* isDone);

/* Copies a file or folder into the crash-report folder of the mobile user. *isDone as above. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCopyLogDirectory(LFMobileHelper* helper,
                                                               const char* source,
                                                               int32_t* isDone);

/* Moves a folder to destinationDirectory/name, which must be a carrier path. The destination
 * directory is made when it is missing. *isDone as above. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperMoveDirectory(LFMobileHelper* helper,
                                                            const char* source,
                                                            const char* destinationDirectory,
                                                            const char* name,
                                                            int32_t* isDone);

/* Expands a ZIP archive into the destination; copies anything else. *isDone as above. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCopyArchive(LFMobileHelper* helper,
                                                          const char* source,
                                                          const char* destination,
                                                          int32_t* isDone);

/* Reads a property-list file whose root is a dictionary, as an XML property list. The caller frees
 * *data with LFMobileHelperFree. NO_DATA: missing, or not a dictionary. NO_SPACE. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperLoadPlistFile(LFMobileHelper* helper,
                                                            const char* path,
                                                            void** data,
                                                            size_t* dataSize);

/* ---- Location, network, radio: the service answers 0 at once and reports elsewhere ----------- */

/* Looks up the address at a place, in degrees, and reports it to the telephony daemon. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperRequestCountryCodeFromLocation(LFMobileHelper* helper,
                                                                             double latitude,
                                                                             double longitude);

/* Reads the configured country code into the caller's buffer, always NUL-terminated. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCopyCountryCode(
    LFMobileHelper* helper, char countryCode[LF_MOBILE_HELPER_COUNTRY_CODE_SIZE]);

/* Looks up the public address of the device and reports it to the telephony daemon. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperRequestWanIPFromLocation(LFMobileHelper* helper);

/* Starts (other than 0) or stops (0) the heartbeat on the cellular interface. It outlives the client
 * and keeps the service alive until it is stopped; started twice, it keeps it for good. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperSetHeartbeatEnabled(LFMobileHelper* helper,
                                                                  int32_t isEnabled);

/* Switches the file logging of the radio manager on (other than 0) or off (0). The result is 0 also
 * where no radio manager runs. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperSetRadioManagerLogging(LFMobileHelper* helper,
                                                                     int32_t isEnabled);

/* Brings service databases up to date: a sum of 1 (umts), 2 (cdma), 4 (lte), 8 (gsm), 16 (scdma).
 * The outcome goes to the message port com.vendra.Linefold.lasd. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperCheckForDatabaseUpdate(LFMobileHelper* helper,
                                                                     int32_t types);

/* ---- Raw messages: for tools and tests that look at the protocol itself ---------------------- */

/* Sends a request made of a header for this id and the given bytes, and receives the reply as it
 * came, header included. Nothing of the reply is checked; what the service thinks of the request
 * stands in it. The result is 0 when a reply arrived.
 * `*replySize` becomes the size of the reply, also when it does not fit: ERROR_REPLY_TOO_LARGE,
 * with the first `replyCapacity` bytes in the buffer. A descriptor that came with the reply goes to
 * the caller in `*replyDescriptor` (-1 for none), who closes it; with `replyDescriptor` NULL the
 * library closes it. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperSendRaw(LFMobileHelper* helper,
                                                      int32_t id,
                                                      const void* bytes,
                                                      size_t size,
                                                      void* reply,
                                                      size_t replyCapacity,
                                                      size_t* replySize,
                                                      int* replyDescriptor);

/* The same with a message that the caller has written whole: exactly these bytes are sent. The
 * service closes the connection without a reply when they are fewer than 24. */
LF_MOBILE_HELPER_EXPORT int32_t LFMobileHelperSendMessage(LFMobileHelper* helper,
                                                          const void* message,
                                                          size_t size,
                                                          void* reply,
                                                          size_t replyCapacity,
                                                          size_t* replySize,
                                                          int* replyDescriptor);

#ifdef __cplusplus
}
#endif

#endif
