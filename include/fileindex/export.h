/// \file
/// Symbol visibility of the library's public interface.
///
/// The library is built with hidden visibility; only declarations marked FILEINDEX_EXPORT are part
/// of the shared library's dynamic symbol table.
#ifndef FILEINDEX_EXPORT_H_
#define FILEINDEX_EXPORT_H_

#if defined(__GNUC__) || defined(__clang__)
#define FILEINDEX_EXPORT __attribute__((visibility("default")))
#else
#define FILEINDEX_EXPORT
#endif

#endif  // FILEINDEX_EXPORT_H_
