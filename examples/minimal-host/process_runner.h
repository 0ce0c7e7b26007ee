/* The program-execution service of the minimal host: the module asks the
 * host to run curl (request class 0x2000) and talks to it in process
 * messages, a 16-byte header (length, id, type, value) and a payload.
 *
 * A start message (type 6) names the program and its arguments, separated by
 * NUL bytes; "./curl" stands for the transfer tool, here curl on PATH. Input
 * messages (type 0) go to the program's standard input, which ends with the
 * first message shorter than the 65536-byte maximum. Each run has a thread of
 * its own that answers "running" (3) or "failed" (4), forwards standard
 * output (1) and standard error (2) and ends with "exited" (5, the exit
 * code). The answers reach the module through the deliver function from that
 * thread, never inside the module's own request: the module holds a lock
 * while it asks.
 *
 * process_runner_handle may be called from any thread. */
#ifndef MINIMAL_HOST_PROCESS_RUNNER_H_
#define MINIMAL_HOST_PROCESS_RUNNER_H_

#include <stdint.h>

#include "alertmod/host_records.h"

/* Hands one process message to the module (IOCTL code 4). */
typedef void (*process_deliver_fn)(const void* message, uint32_t length);

/* Sets the deliver function; call once, before the module is loaded. */
void process_runner_init(process_deliver_fn deliver);

/* Answers one request of class 0x2000: 0 when taken, -1 for a malformed
 * message, an unknown type, a start without a program, a start for an id
 * still running, or when no thread could be started. */
int32_t process_runner_handle(const HostRequest* request);

/* Waits until every run has ended and told the module so. Call after Close
 * and before Unload: a run's thread calls into the module. */
void process_runner_wait_idle(void);

#endif /* MINIMAL_HOST_PROCESS_RUNNER_H_ */
