/* Loaded before the system's library, this shifts the clock of the day of one process by the seconds that
 * stand in the file that SHIFTED_CLOCK_FILE names, a signed 64-bit integer that may change at any time. */

#define _GNU_SOURCE
#include <fcntl.h>
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

static const volatile int64_t* shift;

__attribute__((constructor)) static void map_shift(void) {
    const char* const path = getenv("SHIFTED_CLOCK_FILE");
    const int file = path == NULL ? -1 : open(path, O_RDONLY | O_CLOEXEC);
    if (file >= 0) {
        void* const memory = mmap(NULL, sizeof *shift, PROT_READ, MAP_SHARED, file, 0);
        shift = memory == MAP_FAILED ? NULL : memory;
        close(file);
    }
}

static int64_t seconds_shifted(void) {
    return shift == NULL ? 0 : *shift;
}

int clock_gettime(clockid_t clock, struct timespec* time) {
    const int result = (int)syscall(SYS_clock_gettime, clock, time);
    if (result == 0 && (clock == CLOCK_REALTIME || clock == CLOCK_REALTIME_COARSE)) {
        time->tv_sec += seconds_shifted();
    }
    return result;
}

time_t time(time_t* to) {
    struct timespec now;
    clock_gettime(CLOCK_REALTIME, &now);
    if (to != NULL) {
        *to = now.tv_sec;
    }
    return now.tv_sec;
}

int gettimeofday(struct timeval* restrict to, void* restrict zone) {
    struct timespec now;
    (void)zone;
    clock_gettime(CLOCK_REALTIME, &now);
    to->tv_sec = now.tv_sec;
    to->tv_usec = now.tv_nsec / 1000;
    return 0;
}
