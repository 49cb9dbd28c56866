/* The C interface of libLinefoldArchive.so, which expands ZIP archives. The daemon loads it from
 * its library folder at the first need. No function throws; all may be called on any thread.
 */
#ifndef LINEFOLD_ARCHIVE_MODULE_H
#define LINEFOLD_ARCHIVE_MODULE_H

#ifdef __cplusplus
extern "C" {
#endif

/* Who is asked and told while an archive is expanded. Texts live until the handler returns. */
typedef struct LinefoldArchiveHandlers {
    void* context;
    /* This entry cannot be expanded, with an errno value and the reason in words. Other than 0:
     * leave it out and go on. */
    int (*entryFailed)(void* context, const char* name, int error, const char* reason);
    /* The archive or the disk is at fault; the expansion ends. */
    void (*archiveFailed)(void* context, int error, const char* reason);
} LinefoldArchiveHandlers;

/* Expands the archive in an open regular file into an open directory; both stay the caller's. 0, or
 * the errno value that a handler was called with last before the end. */
int LinefoldArchiveExpand(int archive, int directory, const LinefoldArchiveHandlers* handlers)
#ifdef __cplusplus
    noexcept
#endif
    ;

#ifdef __cplusplus
}
#endif

#endif
