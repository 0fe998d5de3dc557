#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/* Does everything that the C header offers, as a C program would, on its own thread or the library's. 0, or
 * the line of the first step that failed. */
int runCProgram(const char* socket_path, int has_own_thread);

#ifdef __cplusplus
}
#endif
