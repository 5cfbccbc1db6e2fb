#include "engines/lmdb/lmdb_error.h"

#include <lmdb.h>

#include <cerrno>

namespace vemo {
namespace {

const char* Advice(int code) {
  switch (code) {
    case MDB_MAP_FULL:
      return "; the address space reserved for the space is full: close all snapshots and try again, or open "
             "the "
             "space with a larger map";
    case MDB_MAP_RESIZED:
      return "; another process made the space larger than this process has reserved: close all snapshots "
             "and try "
             "again, or open the space with a larger map";
    case MDB_READERS_FULL:
      return "; too many snapshots are open in all processes together: close some";
    case MDB_TXN_FULL:
      return "; one commit changes too much: split it";
    case MDB_PANIC:
      return "; an earlier failure of the disk stopped the space: close all snapshots and try again, or open "
             "it anew";
    case MDB_CORRUPTED:
    case MDB_PAGE_NOTFOUND:
      return "; the file is damaged: restore the space from a backup";
    case ENOSPC:
    case EDQUOT:
      return "; make room on the disk and try again";
    case EFBIG:
      return "; the limit of file sizes (ulimit -f) or of the file system is reached";
    case EACCES:
    case EPERM:
      return "; the user of this process needs write permission on the folder and the files in it";
    case EROFS:
      return "; open the space read-only, or mount its file system for writing";
    case ENOMEM:
      return "; this process may not map so much: raise its limit of address space (ulimit -v) or open the "
             "space with "
             "a smaller map";
    case EMFILE:
    case ENFILE:
      return "; raise the limit of open files (ulimit -n)";
    default:
      return "";
  }
}

}  // namespace

LmdbError::LmdbError(const std::string& operation, const std::string& space, int code)
    : StoreError("cannot " + operation + " " + space + ": " + mdb_strerror(code) + Advice(code)),
      m_code(code) {}

void CheckLmdb(int code, const char* operation, const std::string& space) {
  if (code != MDB_SUCCESS) throw LmdbError(operation, space, code);
}

}  // namespace vemo
