// No-op stand-ins for the library's "forget what you kept" calls, for a tree whose library keeps
// no per-process caches of queue scans or configuration files. Weak, so that the library's own
// definitions win wherever they exist.
namespace WEZO {
namespace FILEINDEX {
namespace detail {

__attribute__((weak)) void ForgetQueueScans() {}
__attribute__((weak)) void ForgetConfigSnapshots() {}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
