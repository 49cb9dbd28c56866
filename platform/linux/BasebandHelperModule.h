/* The C interface of libBasebandHelperServer.so, the baseband-manager helper server that may live
 * in the daemon's process. The daemon loads it from its library folder when it is there; file and
 * folder must be root's own. All functions are called on the main thread; none may throw.
 */
#ifndef LINEFOLD_BASEBAND_HELPER_MODULE_H
#define LINEFOLD_BASEBAND_HELPER_MODULE_H

#ifdef __cplusplus
extern "C" {
#endif

/* A helper server; made and known by the module only. */
typedef struct BasebandHelperModuleServer BasebandHelperModuleServer;

/* Required. Not 0 when this process may host the helper server. */
int LinefoldBasebandHelperCanHost(void);

/* Required. A new server, or NULL to decline. `logServer` is NULL: the daemon has none to share. */
BasebandHelperModuleServer* LinefoldBasebandHelperCreate(void* logServer);

/* Required. Called once each, before the daemon serves and when it has stopped serving. */
void LinefoldBasebandHelperStart(BasebandHelperModuleServer* server);
void LinefoldBasebandHelperStop(BasebandHelperModuleServer* server);

/* Required. Not 0 while the daemon must not exit; asked when the daemon has been idle. */
int LinefoldBasebandHelperIsBusy(BasebandHelperModuleServer* server);

/* Required. The last call for this server. */
void LinefoldBasebandHelperRelease(BasebandHelperModuleServer* server);

#ifdef __cplusplus
}
#endif

#endif
