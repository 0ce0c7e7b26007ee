/* A minimal host for the Alertmod module, in C11 with POSIX threads.
 *
 * It does what a recording server must do to have one alarm mailed:
 *   1. writes a notify.xml with one SMTP server and one profile into the
 *      working directory (the module reads it at Open);
 *   2. loads the module with dlopen and calls Load, then Open;
 *   3. lends the module its two threads: a worker (IOCTL code 1) and a
 *      watchdog (Read mode 0), which stay inside it until Close;
 *   4. answers the module's requests through one callback: log lines,
 *      the watchdog's tick (answered by a Write of class 32), documents,
 *      frame buffer returns, program runs (curl) and password encryption;
 *   5. sends one alarm document through Write and waits for the profile's
 *      status report (request class 4), which it prints;
 *   6. calls Close, waits for its threads, and calls Unload.
 *
 * Usage: minimal-host SMTP_ADDRESS SMTP_PORT RECIPIENT [MODULE]
 * MODULE defaults to the installed module that find_package(Alertmod) named
 * when this program was built. The exit status is 0 when the module reported
 * the alarm's message as delivered. */
#define _POSIX_C_SOURCE 200809L

#include <dlfcn.h>
#include <errno.h>
#include <pthread.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include "alertmod/host_records.h"
#include "process_runner.h"

enum {
  kLogThreshold = 25,     /* the module logs at 25 (information), 50 and 75 */
  kAlarmSender = 0x10000, /* the host module that sends alarm documents */
  kProfileId = 1,         /* the one profile of the notify.xml below */
  kReportTimeoutSeconds = 60,
  kNoReport = -1000,
};

/* The seven exports, resolved by name. */
struct module {
  void* handle;
  int32_t (*load)(LoadParmsIn*, LoadParmsOut*);
  int32_t (*unload)(void);
  int32_t (*open)(void);
  int32_t (*close)(void);
  int32_t (*read)(ReadParmsIn*);
  int32_t (*write)(WriteParmsIn*, WriteParmsOut*);
  int32_t (*ioctl)(IoctlParmsIn*);
};
static struct module g_module;

/* What the callback hands to the main thread. */
static pthread_mutex_t g_lock = PTHREAD_MUTEX_INITIALIZER;
static pthread_cond_t g_changed = PTHREAD_COND_INITIALIZER;
static int g_tick_due;           /* the watchdog asked for its tick */
static int g_status = kNoReport; /* of the profile's status report */
static char g_report[1024];      /* the report's text */

/* ---- Requests of the module ---- */

static int32_t answer_log(const HostRequest* request) {
  if (request->code == kCodeLogLevelQuery) return kLogThreshold;
  if (request->code != kCodeLogWrite || request->data == NULL) return -1;
  const char* level = request->extValue >= 75   ? "error"
                      : request->extValue >= 50 ? "warning"
                                                : "info";
  printf("module %-7s %.*s\n", level, (int)request->length, (const char*)request->data);
  fflush(stdout);
  return 0;
}

/* The tick is answered with a Write from the main thread, never inside the
 * module's own request. */
static int32_t ask_for_tick(void) {
  pthread_mutex_lock(&g_lock);
  g_tick_due = 1;
  pthread_cond_broadcast(&g_changed);
  pthread_mutex_unlock(&g_lock);
  return 0;
}

/* A report reads like <Trellan><Notify ID="786432"><Profiles><smtp ID="1"
 * Status="0" Time="..."/>...; Status 0 means delivered, 1 failed. */
static int32_t take_status_report(const HostRequest* request) {
  if (request->data == NULL) return -1;
  pthread_mutex_lock(&g_lock);
  size_t length = request->length < sizeof g_report - 1 ? request->length : sizeof g_report - 1;
  memcpy(g_report, request->data, length);
  g_report[length] = '\0';
  const char* status = strstr(g_report, " Status=\"");
  if (status != NULL) g_status = atoi(status + strlen(" Status=\""));
  pthread_cond_broadcast(&g_changed);
  pthread_mutex_unlock(&g_lock);
  return 0;
}

static int32_t host_callback(HostRequest* request, void* reserved) {
  (void)reserved;
  if (request == NULL) return -1;
  switch (request->requestClass) {
    case kClassLog:
      return answer_log(request);
    case kClassWatchdogTick:
      return ask_for_tick();
    case kClassProfileStatus:
      return take_status_report(request);
    case kClassDocument:
      /* The module's description and configuration: a real host keeps the
       * configuration to show and edit it. */
      return 0;
    case kClassFrameRelease:
      /* A kept frame comes back (request->data is its buffer); this host
       * sends no frames. */
      return 0;
    case kClassProcess:
      return process_runner_handle(request);
    case kClassCrypto:
      /* Password encryption with the host's key. The notify.xml below has
       * no password, so this host refuses; a real host encrypts in place. */
      return -1;
    default:
      return -1;
  }
}

static void deliver_process_message(const void* message, uint32_t length) {
  IoctlParmsIn in;
  memset(&in, 0, sizeof in);
  in.code = kIoctlProcessMessage;
  in.data = message;
  in.length = length;
  g_module.ioctl(&in);
}

/* ---- Setting up ---- */

static int write_configuration(const char* address, int port, const char* recipient) {
  FILE* file = fopen("notify.xml", "w");
  if (file == NULL) return 0;
  fprintf(file,
          "<?xml version=\"1.0\" ?>\n"
          "<Trellan Delta=\"0\">\n"
          "  <Notify ID=\"786432\">\n"
          "    <Servers>\n"
          "      <smtp description=\"mail relay\" address=\"%s\" port=\"%d\" UseSSL=\"0\" />\n"
          "    </Servers>\n"
          "    <Profiles autoincrement=\"%d\">\n"
          "      <smtp ID=\"%d\" attach=\"0\" description=\"Front door\" "
          "from=\"recorder@example.com\" subject=\"{event type} on {system name}\">\n"
          "        <to>%s</to>\n"
          "        <body>{event type} ({event state}) at {date} {time}.</body>\n"
          "      </smtp>\n"
          "    </Profiles>\n"
          "  </Notify>\n"
          "</Trellan>\n",
          address, port, kProfileId + 1, kProfileId, recipient);
  return fclose(file) == 0;
}

static int resolve(void** function, const char* name) {
  *function = dlsym(g_module.handle, name);
  if (*function == NULL) fprintf(stderr, "minimal-host: the module lacks %s\n", name);
  return *function != NULL;
}

static int open_module(const char* path) {
  g_module.handle = dlopen(path, RTLD_NOW | RTLD_LOCAL);
  if (g_module.handle == NULL) {
    fprintf(stderr, "minimal-host: %s\n", dlerror());
    return 0;
  }
  /* Object pointers to function pointers, as POSIX allows for dlsym. */
  return resolve((void**)&g_module.load, "Load") && resolve((void**)&g_module.unload, "Unload") &&
         resolve((void**)&g_module.open, "Open") && resolve((void**)&g_module.close, "Close") &&
         resolve((void**)&g_module.read, "Read") && resolve((void**)&g_module.write, "Write") &&
         resolve((void**)&g_module.ioctl, "IOCTL");
}

static void* run_worker(void* unused) {
  (void)unused;
  IoctlParmsIn in;
  memset(&in, 0, sizeof in);
  in.code = kIoctlRunWorker;
  g_module.ioctl(&in);
  return NULL;
}

static void* run_watchdog(void* unused) {
  (void)unused;
  ReadParmsIn in;
  memset(&in, 0, sizeof in);
  in.mode = kReadModeWatchdog;
  g_module.read(&in);
  return NULL;
}

/* ---- The alarm ---- */

/* Writes a document from another module of the host (not 0xC0000). */
static void write_document(const char* text) {
  WriteParmsIn in;
  memset(&in, 0, sizeof in);
  in.data = text;
  in.length = (uint32_t)strlen(text);
  in.source = kAlarmSender;
  WriteParmsOut out;
  memset(&out, 0, sizeof out);
  g_module.write(&in, &out);
}

/* Motion (event type 2) starts on input 0 of device 1 of plug-in 0x10000,
 * for event definition 7, which notifies profile 1. A host that sent its
 * system document (IOCTL code 2) first would have the camera named in the
 * message; this one sends none. */
static void send_alarm(void) {
  char text[512];
  snprintf(text, sizeof text,
           "<Trellan><Servers><Server Serial=\"SN-1\" Description=\"Minimal host\"/></Servers>"
           "<Notify ID=\"786432\"><Profiles><Profile Alarm=\"1\" ID=\"%d\" Action=\"7\" "
           "Time=\"%lld\"><EventSource Plugin=\"65536\" Device=\"1\" Input=\"0\" Context=\"0\" "
           "Type=\"2\"/></Profile></Profiles></Notify></Trellan>",
           kProfileId, (long long)time(NULL));
  write_document(text);
}

static void answer_tick(void) {
  WriteParmsIn in;
  memset(&in, 0, sizeof in);
  in.source = kModuleId;
  in.requestClass = kWriteClassTick;
  WriteParmsOut out;
  memset(&out, 0, sizeof out);
  g_module.write(&in, &out);
}

/* Answers ticks until the status report arrives; returns its status, or
 * kNoReport after the time-out. */
static int wait_for_report(void) {
  struct timespec deadline;
  clock_gettime(CLOCK_REALTIME, &deadline);
  deadline.tv_sec += kReportTimeoutSeconds;
  pthread_mutex_lock(&g_lock);
  while (g_status == kNoReport) {
    if (g_tick_due) {
      g_tick_due = 0;
      pthread_mutex_unlock(&g_lock);
      answer_tick();
      pthread_mutex_lock(&g_lock);
      continue;
    }
    if (pthread_cond_timedwait(&g_changed, &g_lock, &deadline) == ETIMEDOUT) break;
  }
  int status = g_status;
  if (status != kNoReport) printf("host: status report %s\n", g_report);
  pthread_mutex_unlock(&g_lock);
  return status;
}

int main(int argc, char** argv) {
  if (argc < 4 || argc > 5) {
    fprintf(stderr, "usage: minimal-host SMTP_ADDRESS SMTP_PORT RECIPIENT [MODULE]\n");
    return 2;
  }
  const char* module_path = argc == 5 ? argv[4] : ALERTMOD_MODULE_PATH;
  /* A program that stops reading its input must not end this host. */
  signal(SIGPIPE, SIG_IGN);
  if (!write_configuration(argv[1], atoi(argv[2]), argv[3])) {
    fprintf(stderr, "minimal-host: cannot write notify.xml\n");
    return 1;
  }
  if (!open_module(module_path)) return 1;
  process_runner_init(deliver_process_message);

  LoadParmsIn load_in;
  LoadParmsOut load_out;
  memset(&load_in, 0, sizeof load_in);
  memset(&load_out, 0, sizeof load_out);
  load_in.callback = host_callback;
  g_module.load(&load_in, &load_out);
  printf("host: loaded %s, module id 0x%X\n", module_path, load_out.moduleId);
  g_module.open();
  pthread_t worker, watchdog;
  pthread_create(&worker, NULL, run_worker, NULL);
  pthread_create(&watchdog, NULL, run_watchdog, NULL);

  send_alarm();
  int status = wait_for_report();
  if (status == kNoReport)
    printf("host: no status report within %d s\n", kReportTimeoutSeconds);
  else
    printf("host: profile %d %s\n", kProfileId, status == 0 ? "delivered" : "FAILED");

  g_module.close();
  pthread_join(worker, NULL);
  pthread_join(watchdog, NULL);
  process_runner_wait_idle();
  g_module.unload();
  dlclose(g_module.handle);
  return status == 0 ? 0 : 1;
}
