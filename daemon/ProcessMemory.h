#pragma once

namespace kx {

// For the start of a program, once, before its first thread. A sync reads the same large files
// several times, on several threads: the process keeps what it has freed and uses it again instead
// of giving it back and having it cleared anew, its threads share one pool, and the system is asked
// for large pages. What the system refuses costs time and nothing else.
void keepFreedMemory();

}  // namespace kx
