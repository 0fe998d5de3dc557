#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/* Does everything that the C header offers, as a C program would. 0, or the line of the first step that
 * failed. */
int runCProgram(const char* socket_path);
/* The same with the library's own thread. */
int runCProgramInBackground(const char* socket_path);

#ifdef __cplusplus
}
#endif
