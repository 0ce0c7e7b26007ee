#define _GNU_SOURCE /* pipe2 */
#include "process_runner.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <spawn.h>
#include <stdlib.h>
#include <string.h>
#include <sys/wait.h>
#include <unistd.h>

extern char** environ;

enum { kMaxPayloadBytes = kProcessMessageMaxBytes - kProcessHeaderBytes };

static const char kTransferToolName[] = "./curl";
static const char kTransferTool[] = "curl";

struct run {
  uint32_t id;
  char** argv;
  pid_t pid;
  int wake[2]; /* a byte in wake[0] says that input arrived */
  /* Guarded by g_lock: */
  char* input;
  size_t input_length;
  int input_ended;
  struct run* next;
};

static pthread_mutex_t g_lock = PTHREAD_MUTEX_INITIALIZER;
static pthread_cond_t g_idle = PTHREAD_COND_INITIALIZER;
static struct run* g_running; /* by id, until the program has ended */
static int g_threads;         /* run threads not finished yet */
static process_deliver_fn g_deliver;

static void send_message(uint32_t id, uint32_t type, uint32_t value, const char* payload,
                         size_t length) {
  static _Thread_local char message[kProcessMessageMaxBytes];
  ProcessMessageHeader header = {(uint32_t)(kProcessHeaderBytes + length), id, type, value};
  memcpy(message, &header, sizeof header);
  if (length > 0) memcpy(message + kProcessHeaderBytes, payload, length);
  g_deliver(message, header.length);
}

static void free_words(char** words) {
  for (char** word = words; word != NULL && *word != NULL; ++word) free(*word);
  free(words);
}

static void free_run(struct run* run) {
  free_words(run->argv);
  free(run->input);
  close(run->wake[0]);
  close(run->wake[1]);
  free(run);
}

/* The program and its arguments from a start payload: the optional texts
 * that flags 8 and 16 put first are skipped. NULL when there is no program. */
static char** parse_command(uint32_t flags, const char* payload, size_t length) {
  size_t words = 1;
  for (size_t i = 0; i < length; ++i) words += payload[i] == '\0';
  size_t skip =
      ((flags & kProcessFlagFirstText) ? 1 : 0) + ((flags & kProcessFlagSecondText) ? 1 : 0);
  if (words <= skip) return NULL;
  char** argv = calloc(words - skip + 1, sizeof *argv);
  size_t count = 0, word = 0, begin = 0;
  for (size_t i = 0; argv != NULL && i <= length; ++i) {
    if (i < length && payload[i] != '\0') continue;
    if (word++ >= skip) argv[count++] = strndup(payload + begin, i - begin);
    begin = i + 1;
  }
  if (argv == NULL || argv[0] == NULL || argv[0][0] == '\0') {
    free_words(argv);
    return NULL;
  }
  if (strcmp(argv[0], kTransferToolName) == 0) {
    free(argv[0]);
    argv[0] = strdup(kTransferTool);
  }
  return argv;
}

static struct run* find_run(uint32_t id) {
  for (struct run* run = g_running; run != NULL; run = run->next) {
    if (run->id == id) return run;
  }
  return NULL;
}

/* Forgets the run before the module hears of its end, so that the module
 * may use the id again at once; then frees it. */
static void finish(struct run* run, uint32_t type, int32_t value) {
  pthread_mutex_lock(&g_lock);
  for (struct run** link = &g_running; *link != NULL; link = &(*link)->next) {
    if (*link == run) {
      *link = run->next;
      break;
    }
  }
  pthread_mutex_unlock(&g_lock);
  send_message(run->id, type, (uint32_t)value, NULL, 0);
  free_run(run);
  pthread_mutex_lock(&g_lock);
  if (--g_threads == 0) pthread_cond_broadcast(&g_idle);
  pthread_mutex_unlock(&g_lock);
}

/* Starts the program with pipes for its standard input, output and error;
 * returns 0 or the error number. */
static int spawn(struct run* run, int* input_fd, int* output_fd, int* error_fd) {
  int pipes[3][2];
  for (int i = 0; i < 3; ++i) {
    if (pipe2(pipes[i], O_CLOEXEC) != 0) return errno;
  }
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, pipes[0][0], 0);
  posix_spawn_file_actions_adddup2(&actions, pipes[1][1], 1);
  posix_spawn_file_actions_adddup2(&actions, pipes[2][1], 2);
  int error = posix_spawnp(&run->pid, run->argv[0], &actions, NULL, run->argv, environ);
  posix_spawn_file_actions_destroy(&actions);
  close(pipes[0][0]);
  close(pipes[1][1]);
  close(pipes[2][1]);
  *input_fd = pipes[0][1];
  *output_fd = pipes[1][0];
  *error_fd = pipes[2][0];
  return error;
}

/* Writes the input that arrived. The module's input is a line or two, so a
 * plain blocking write does; the input is closed once the module ended it. */
static void feed_input(struct run* run, int* input_fd) {
  char byte[64];
  ssize_t ignored = read(run->wake[0], byte, sizeof byte);
  (void)ignored;
  pthread_mutex_lock(&g_lock);
  char* input = run->input;
  size_t length = run->input_length;
  int ended = run->input_ended;
  run->input = NULL;
  run->input_length = 0;
  pthread_mutex_unlock(&g_lock);
  for (size_t done = 0; *input_fd >= 0 && done < length;) {
    ssize_t n = write(*input_fd, input + done, length - done);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break; /* the program stopped reading (SIGPIPE is ignored) */
    done += (size_t)n;
  }
  free(input);
  if (ended && *input_fd >= 0) {
    close(*input_fd);
    *input_fd = -1;
  }
}

static void forward_output(struct run* run, int* fd, uint32_t type) {
  char buffer[kMaxPayloadBytes];
  ssize_t n = read(*fd, buffer, sizeof buffer);
  if (n > 0) {
    send_message(run->id, type, 0, buffer, (size_t)n);
  } else if (n == 0 || errno != EINTR) {
    close(*fd);
    *fd = -1;
  }
}

static void* run_program(void* argument) {
  struct run* run = argument;
  int input_fd = -1, output_fd = -1, error_fd = -1;
  int error = spawn(run, &input_fd, &output_fd, &error_fd);
  if (error != 0) {
    if (input_fd >= 0) close(input_fd);
    if (output_fd >= 0) close(output_fd);
    if (error_fd >= 0) close(error_fd);
    finish(run, kProcessFailed, error);
    return NULL;
  }
  send_message(run->id, kProcessRunning, (uint32_t)run->pid, NULL, 0);
  /* The program has ended when both of its outputs are closed. */
  while (output_fd >= 0 || error_fd >= 0) {
    struct pollfd fds[3] = {
        {run->wake[0], POLLIN, 0}, {output_fd, POLLIN, 0}, {error_fd, POLLIN, 0}};
    if (poll(fds, 3, -1) < 0 && errno != EINTR) break;
    if (fds[0].revents != 0) feed_input(run, &input_fd);
    if (fds[1].revents != 0) forward_output(run, &output_fd, kProcessOutput);
    if (fds[2].revents != 0) forward_output(run, &error_fd, kProcessErrorOutput);
  }
  if (input_fd >= 0) close(input_fd);
  int status = 0;
  while (waitpid(run->pid, &status, 0) < 0 && errno == EINTR) {
  }
  finish(run, kProcessExited, WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status));
  return NULL;
}

static int32_t start_run(uint32_t id, uint32_t flags, const char* payload, size_t length) {
  char** argv = parse_command(flags, payload, length);
  if (argv == NULL) return -1;
  struct run* run = calloc(1, sizeof *run);
  if (run == NULL || pipe2(run->wake, O_CLOEXEC | O_NONBLOCK) != 0) {
    free_words(argv);
    free(run);
    return -1;
  }
  run->id = id;
  run->argv = argv;
  pthread_mutex_lock(&g_lock);
  pthread_attr_t attributes;
  pthread_attr_init(&attributes);
  pthread_attr_setdetachstate(&attributes, PTHREAD_CREATE_DETACHED);
  pthread_t thread;
  int refused = find_run(id) != NULL || pthread_create(&thread, &attributes, run_program, run) != 0;
  pthread_attr_destroy(&attributes);
  if (!refused) {
    /* Registered before the lock is given up, so the run thread cannot
     * finish (and forget it) first. */
    run->next = g_running;
    g_running = run;
    ++g_threads;
  }
  pthread_mutex_unlock(&g_lock);
  if (refused) free_run(run);
  return refused ? -1 : 0;
}

static int32_t add_input(uint32_t id, const char* payload, size_t length, int last) {
  pthread_mutex_lock(&g_lock);
  struct run* run = find_run(id);
  int taken = run != NULL && !run->input_ended;
  if (taken) {
    char* grown = realloc(run->input, run->input_length + length + 1);
    if (grown != NULL) {
      memcpy(grown + run->input_length, payload, length);
      run->input = grown;
      run->input_length += length;
    }
    run->input_ended = last;
    ssize_t ignored = write(run->wake[1], "i", 1);
    (void)ignored;
  }
  pthread_mutex_unlock(&g_lock);
  /* Input for a program that has ended is dropped, as a closed pipe would. */
  return 0;
}

void process_runner_init(process_deliver_fn deliver) {
  g_deliver = deliver;
}

int32_t process_runner_handle(const HostRequest* request) {
  if (request->data == NULL || request->length < kProcessHeaderBytes ||
      request->length > kProcessMessageMaxBytes) {
    return -1;
  }
  ProcessMessageHeader header;
  memcpy(&header, request->data, sizeof header);
  if (header.length != request->length) return -1;
  const char* payload = (const char*)request->data + kProcessHeaderBytes;
  size_t length = request->length - kProcessHeaderBytes;
  if (header.type == kProcessStart) return start_run(header.id, header.value, payload, length);
  if (header.type == kProcessInput) {
    return add_input(header.id, payload, length, request->length < kProcessMessageMaxBytes);
  }
  return -1;
}

void process_runner_wait_idle(void) {
  pthread_mutex_lock(&g_lock);
  while (g_threads > 0) pthread_cond_wait(&g_idle, &g_lock);
  pthread_mutex_unlock(&g_lock);
}
