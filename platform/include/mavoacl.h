/* libmavoacl, host implementation: the ACL of EA directories.
 *
 * A build for the real platform links the platform's library instead.
 */
#ifndef MAVOACL_H_
#define MAVOACL_H_

#ifdef __cplusplus
extern "C" {
#endif

#if defined(__GNUC__)
#define MAVOACL_API __attribute__((visibility("default")))
#else
#define MAVOACL_API
#endif

/* Gives the directory szPath a default ACL under which every user of the share can use what is made
 * inside it, whatever the maker's umask. A symbolic link is not followed. 0, also on a filesystem
 * without ACLs; -1 with errno on failure. */
MAVOACL_API int MAVOACLSetEADirACL(const char* szPath);

#ifdef __cplusplus
}
#endif

#endif /* MAVOACL_H_ */
