// What the fuzz targets share: a sandbox root of the process's own, made the library's root
// prefix, with the appliance's directories; the fake platform; the library's log kept out of the
// system log; and a stand-in daemon that reads every command.
#ifndef FILEINDEX_FUZZ_FUZZ_SUPPORT_H_
#define FILEINDEX_FUZZ_FUZZ_SUPPORT_H_

#include <cstddef>
#include <cstdint>
#include <string>

namespace fuzzsupport {

// Makes the sandbox on first use and returns its root. It lies under $TMPDIR, or /dev/shm where
// that exists so that the library's fsync costs nothing, and is removed when the process exits.
const std::string& Root();

// A fresh fake platform whose shares "photo" and "video" lie in `volume`.
void ResetPlatform(const std::string& volume);

// Replaces the file at `path` with the `size` bytes at `data`, or aborts.
void WriteBytes(const std::string& path, const uint8_t* data, size_t size);
std::string ReadBytes(const std::string& path);

// How many "Malformed command" lines the queue reader has logged since the last call.
size_t TakeMalformedLineCount();

// Starts, once, a thread that accepts every connection on the daemon socket and reads it to its
// end, so that commands go through.
void StartDaemon();

// Reports a broken property and aborts, which the fuzzer records as a crash with this input.
[[noreturn]] void Fail(const std::string& what);

}  // namespace fuzzsupport

#endif  // FILEINDEX_FUZZ_FUZZ_SUPPORT_H_
