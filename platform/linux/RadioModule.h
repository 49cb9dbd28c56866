/* The C interface of libLinefoldRadio.so, which speaks to the modem manager over the system bus. A
 * module of our own, so that the daemon does not pay for the bus library before it needs it.
 */
#ifndef LINEFOLD_RADIO_MODULE_H
#define LINEFOLD_RADIO_MODULE_H

#ifdef __cplusplus
extern "C" {
#endif

/* Asks the modem manager to log everything (isEnabled is not 0) or errors alone, and waits until it
 * answers, at most two seconds. 0, or an errno value: ENOENT when there is no bus, EHOSTUNREACH
 * when no modem manager runs, ETIMEDOUT, or what the modem manager's own error stands for. From any
 * thread. */
int LinefoldRadioSetLogging(int isEnabled)
#ifdef __cplusplus
    noexcept
#endif
    ;

#ifdef __cplusplus
}
#endif

#endif
