/* The C interface of libLinefoldHttp.so, which carries out HTTP requests. The daemon loads it with
 * the first of them, since its libraries weigh more than the daemon. No function throws.
 */
#ifndef LINEFOLD_HTTP_MODULE_H
#define LINEFOLD_HTTP_MODULE_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
#define LINEFOLD_HTTP_NOEXCEPT noexcept
extern "C" {
#else
#define LINEFOLD_HTTP_NOEXCEPT
#endif

enum { LINEFOLD_HTTP_DETAIL_SIZE = 256 };

/* The numbers are those of hvu::Http::ErrorType, but for the last. */
typedef enum {
    LINEFOLD_HTTP_UNKNOWN = 0,
    LINEFOLD_HTTP_DONE = 1,
    LINEFOLD_HTTP_HOST_NOT_FOUND = 2,
    LINEFOLD_HTTP_CANNOT_CONNECT = 3,
    LINEFOLD_HTTP_CELLULAR_FORBIDDEN = 4,
    LINEFOLD_HTTP_TIMED_OUT = 5,
    LINEFOLD_HTTP_NOT_TRUSTED = 6,
    LINEFOLD_HTTP_CONNECTION_LOST = 7,
    LINEFOLD_HTTP_REDIRECT_REFUSED = 8,
    LINEFOLD_HTTP_BODY_TOO_LARGE = 9,
    LINEFOLD_HTTP_BAD_ANSWER = 10,
    LINEFOLD_HTTP_BAD_URL = 11,
    LINEFOLD_HTTP_SINK_REFUSED = 100 /* one of the functions below ended the request */
} LinefoldHttpOutcome;

/* What is asked, and who takes what comes. All of it stays the caller's and in place meanwhile. */
typedef struct {
    const char* url;
    const char* const* header_lines; /* "Name: value" each, NULL behind the last */
    int is_cellular_allowed;
    uint64_t body_max; /* a larger announced size ends the request before any of it came */
    int64_t
        connect_timeout_ms;  /* looking the name up and agreeing on a secure connection included */
    int64_t stall_timeout_s; /* below 1 byte a second for so long */
    int64_t total_timeout_s;
    void* context;

    /* Each line of the header with its line end, status lines included; each of those begins a new
     * header. What comes behind the body is left out. 0 to go on. */
    int (*take_header_line)(void* context, const char* line, size_t size);

    /* The body, piece by piece, as the server sent it. That of a redirect is left out. 0 to go on.
     */
    int (*take_body)(void* context, const void* bytes, size_t size);
} LinefoldHttpRequest;

typedef struct {
    LinefoldHttpOutcome outcome;
    int status_code;                        /* the last that came, or 0 */
    char detail[LINEFOLD_HTTP_DETAIL_SIZE]; /* why, in words of the library; may be empty */
} LinefoldHttpResult;

/* Carries out a GET, on any thread, and comes back when it is over. Redirects are followed. */
__attribute__((visibility("default"))) void LinefoldHttpGet(
    const LinefoldHttpRequest* request, LinefoldHttpResult* result) LINEFOLD_HTTP_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif
