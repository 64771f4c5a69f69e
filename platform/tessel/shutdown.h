#ifndef PLATFORM_TESSEL_SHUTDOWN_H_
#define PLATFORM_TESSEL_SHUTDOWN_H_

/* For hosts in plain C. */

#ifdef __cplusplus
extern "C" {
#endif

/* tessel::threads::Shutdown: to be called behind a plug-in's last command, before its library is
 * unloaded, and not from a task. */
void tessel_shutdown(void);

#ifdef __cplusplus
}
#endif

#endif
