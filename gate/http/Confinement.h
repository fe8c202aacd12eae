// What the process that reads HTTP takes away from itself before it reads the first byte.

#ifndef GATE_HTTP_CONFINEMENT_H
#define GATE_HTTP_CONFINEMENT_H

namespace gate {

// Root becomes the user szUser, in an empty directory for a root, without capabilities and groups. Whoever it
// is, it gains no privileges any more, ends with its parent, writes no files, starts no processes, and makes
// none but the system calls that serving takes: any other ends it. Throws std::system_error or
// std::runtime_error.
void confine(const char* szUser);

} // namespace gate

#endif
