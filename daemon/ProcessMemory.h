#pragma once

namespace kx {

// For the start of a program, once, before its first thread. A sync reads the same large files
// several times, on several threads: the process keeps what it has freed and uses it again instead
// of giving it back and having it cleared anew, and its threads share one pool.
void keepFreedMemory();

}  // namespace kx
