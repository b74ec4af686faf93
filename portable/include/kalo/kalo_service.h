// The platform's service control: starting, stopping and restarting the
// system services the package depends on, by name. On Linux a service is a
// systemd unit when systemd runs (the directory /run/systemd/system exists,
// looked for under ORVEX_ROOT like every fixed path, so a private root never
// touches the machine's units); otherwise the program named by the
// environment variable ORVEX_SERVICE_CTL is run with the action ("start",
// "stop" or "restart") and the service name, the way `orvex up` and tests
// stand in for a service manager. Every call waits for the control program to
// end. Thread-safe (each call forks its own child).
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_SERVICE_H_
#define KALO_KALO_SERVICE_H_

#ifndef TRUE
#define TRUE 1
#endif
#ifndef FALSE
#define FALSE 0
#endif

// The service-control kind of KLIBServicectlStart and KLIBServicectlStop:
// the platform's upstart jobs. On Linux it is run like any other service.
constexpr int KLIB_SERVICECTL_UPSTART = 1;

// The control program ran but refused the action (non-zero exit status).
constexpr int KLIB_ERR_SERVICE_CONTROL = 0x3100;
// Neither systemd nor ORVEX_SERVICE_CTL is there to act on a service.
constexpr int KLIB_ERR_NO_SERVICE_MANAGER = 0x3200;

// The environment variable naming the stand-in control program.
constexpr char kServiceCtlEnv[] = "ORVEX_SERVICE_CTL";
// Present while systemd is the service manager (under ORVEX_ROOT).
constexpr char kSystemdRunDir[] = "/run/systemd/system";

// Each returns 0 when the control program reports success and -1 otherwise,
// with the last error (kalo_error.h) set: KLIB_ERR_BAD_PARAMETER for a null
// or empty name or an unknown servicectl type, KLIB_ERR_NO_SERVICE_MANAGER
// when there is no way to control services, KLIB_ERR_EXEC when the control
// program cannot be run, KLIB_ERR_SERVICE_CONTROL when it exits non-zero.
//
// wait: with systemd, FALSE queues the job and returns at once
// ("--no-block"); the stand-in program always decides for itself.
int KLIBServiceStart(const char* name, int wait);
int KLIBServiceStop(const char* name, int wait);
int KLIBServiceRestart(const char* name);
int KLIBServicectlStart(const char* name, int type);
int KLIBServicectlStop(const char* name, int type);

#endif  // KALO_KALO_SERVICE_H_
