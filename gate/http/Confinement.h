// The rights that the process that reads HTTP gives up before it reads the first byte.

#ifndef GATE_HTTP_CONFINEMENT_H
#define GATE_HTTP_CONFINEMENT_H

namespace gate {

// If it is root, the process becomes the user szUser, with an empty root directory, and without capabilities
// or additional groups. In any case, it can gain no privileges, write no files and start no processes, and it
// ends with its parent. It may make only the system calls that serving needs; any other ends it. Throws
// std::system_error or std::runtime_error.
void confine(const char* szUser);

} // namespace gate

#endif
