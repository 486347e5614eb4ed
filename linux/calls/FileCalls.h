#pragma once
// Every call by which a recording changes a disk or writes to a peer, in one place: what records, exports, saves,
// reports and answers goes through here, and nothing else in those folders calls the system for it.

#include <linux/openat2.h>
#include <sys/socket.h>
#include <sys/statvfs.h>
#include <sys/types.h>

#include <cstddef>
#include <string>

/// Each does what the call of the system that stands behind it does, and answers the same: -1 with errno set for a
/// failure; but none is ever interrupted (EINTR), as it is made again then. They may wait for the disk, those on sockets
/// only when their flags let them. Callable from any thread.
namespace lumacast::calls {

int openAt(int folder, const std::string& path, int flags, mode_t mode = 0);               // openat
int openResolved(int folder, const std::string& path, const open_how& how);                // openat2
int makeDirectoryAt(int folder, const std::string& path, mode_t mode);                     // mkdirat
ssize_t write(int file, const void* bytes, std::size_t count);                             // write
ssize_t writeAt(int file, const void* bytes, std::size_t count, off_t offset);             // pwrite
ssize_t copyRange(int from, int to, std::size_t count);                                    // copy_file_range
int clone(int from, int to);                                                               // ioctl FICLONE
int reserve(int file, off_t size);                                                         // fallocate, keeping the size
int truncate(int file, off_t size);                                                        // ftruncate
int sync(int file);                                                                        // fsync
int syncData(int file);                                                                    // fdatasync
int startWriteBack(int file, off_t offset, off_t count, unsigned flags);                   // sync_file_range
int rename(int fromFolder, const std::string& from, int toFolder, const std::string& to);  // renameat
int renameToNew(int fromFolder, const std::string& from, int toFolder,
                const std::string& to);                                                    // renameat2, RENAME_NOREPLACE
int link(int fromFolder, const std::string& from, int toFolder, const std::string& to, int flags);  // linkat
int unlinkAt(int folder, const std::string& path, int flags = 0);                          // unlinkat
int statFileSystem(int file, struct statvfs& status);                                      // fstatvfs
ssize_t sendMessage(int socket, const msghdr& message, int flags);                         // sendmsg

}  // namespace lumacast::calls
