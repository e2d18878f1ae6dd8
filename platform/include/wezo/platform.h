/* The appliance's platform as the file-index library sees it.
 *
 * These are the only platform operations the library calls: the share database, file-system
 * facts, the platform's last-error slot, program execution, service control, the SMB Spotlight
 * setting and a case-insensitive UTF-8 comparison. Each declaration states what it returns on
 * success, on failure and for "not found". An implementation of this header (the generic-Linux
 * one under platform/linux, the appliance's own libraries, or the in-memory fake of the tests)
 * is linked beside the library; porting the library means providing another one.
 *
 * Unless a comment says otherwise an operation is reentrant, and a failing operation records its
 * reason in the last-error slot (WLIBCErrGet and friends). The file-change monitor's client is
 * declared in wezo/wezotifyd.h.
 */
#ifndef WEZO_PLATFORM_H_
#define WEZO_PLATFORM_H_

#ifdef __cplusplus
extern "C" {
#endif

/* Sizes of the share record's strings, terminating zero included. */
#define WEZO_SHARE_NAME_MAX 492
#define WEZO_SHARE_PATH_MAX 4096

/* Platform error numbers that the library tells apart. */
#define WLIBC_ERR_BAD_PARAMETERS 0x0D00 /* an argument was null, empty or out of range */
#define WLIBC_ERR_NO_SPACE 0x2900       /* the volume has no room left */
#define WLIBC_ERR_OVER_QUOTA 0x2400     /* a quota forbids the requested room */

/* File-system type codes of WEZOGetFSType. Any other non-negative value is a type of the
 * platform's own; only these two have a fixed meaning for the library. */
#define WEZO_FSTYPE_UNKNOWN (-1)
#define WEZO_FSTYPE_NEVER_INDEXED 12 /* a type whose contents are never indexed */

/* Queue type of the file-change monitor's registrations. */
#define WEZO_MONITOR_QUEUE_TYPE_FILE 1

/* One shared folder. Obtained from WEZOShareGet and released with WEZOShareFree; the library
 * reads szName and szPath and hands the record back to the WLIBShareIs... queries. */
/* NOLINTNEXTLINE(bugprone-reserved-identifier) */
typedef struct _tag_WEZOSHARE {
  char szName[WEZO_SHARE_NAME_MAX]; /* the share's name, "photo" */
  char szPath[WEZO_SHARE_PATH_MAX]; /* the share's own full path, "/volume1/photo" */
  void* pPrivate;                   /* the implementation's own data; the library never reads it */
} WEZOSHARE, *PWEZOSHARE;

/* ---- Share database ---------------------------------------------------------------------- */

/* Looks up the share named szName. On success stores a new record in *ppShare, which the caller
 * releases with WEZOShareFree, and returns 0. Returns a negative number, leaving *ppShare as it
 * was, when szName or ppShare is null or no share has that name (case-sensitive). */
int WEZOShareGet(const char* szName, PWEZOSHARE* ppShare);

/* Releases a record of WEZOShareGet. A null pShare is ignored. */
void WEZOShareFree(PWEZOSHARE pShare);

/* Finds the share that holds the full path szFullPath (the share's own path itself, or a path
 * below it at a "/" boundary) and copies its name and its own full path into the caller's
 * buffers, each cut to the given size with a terminating zero. Returns 0 on success, a negative
 * number when an argument is null or not positive or no share holds the path. */
int WEZOShareNamePathGet(const char* szFullPath, char* szShareName, int cbShareName,
                         char* szSharePath, int cbSharePath);

/* Whether the share is encrypted (its data is stored encrypted and is not readable while it is
 * locked). Stores 1 or 0 in *pfEncrypted and returns 0 or a positive number; negative on
 * failure, *pfEncrypted then untouched. */
int WLIBShareIsEncryptedGet(const WEZOSHARE* pShare, int* pfEncrypted);

/* Whether the share is set up for encryption (the setting, as opposed to its current state).
 * Same results as WLIBShareIsEncryptedGet. */
int WLIBShareIsEncryptionGet(const WEZOSHARE* pShare, int* pfEncryption);

/* Whether the share is read-only. Same results as WLIBShareIsEncryptedGet. */
int WLIBShareIsReadOnlyGet(const WEZOSHARE* pShare, int* pfReadOnly);

/* 1 when the full path lies in a share's recycle bin, 0 when not or when that cannot be told. */
int WEZOShareIsShareRecycle(const char* szFullPath);

/* ---- File-system facts ------------------------------------------------------------------- */

/* The type code of the file system that holds szPath; flags is 0. Returns WEZO_FSTYPE_UNKNOWN
 * when the path does not exist or its file system is not known. */
int WEZOGetFSType(const char* szPath, int flags);

/* Non-zero when the type code names a network file system. */
int WEZOFSIsRemoteFS(int fsType);

/* Non-zero when the type code names a disk-image file system (optical or compressed image). */
int WEZOFSIsImageFS(int fsType);

/* 1 when szPath is a directory on which a file system is mounted, 0 when it is not, negative
 * when that cannot be told (for instance the path does not exist). */
int WEZOFSDirIsMntPoint(const char* szPath);

/* Whether the full path lies in a snapshot. Stores 1 or 0 in *pfInSnapshot and returns 0;
 * negative on failure, *pfInSnapshot then untouched. */
int WLIBFhsPathInSnapshot(const char* szPath, int* pfInSnapshot);

/* 1 when szName (a single name, no slashes) is the name of the platform's hidden metadata
 * directory ("@eaDir"), 0 otherwise. */
int WEZOEAIsHiddenDir(const char* szName);

/* Creates the hidden metadata directory szPath (a share's root followed by "/@eaDir") with the
 * platform's ownership and mode; flags is 0. Returns 0 when it exists afterwards (an existing
 * directory is success), negative on failure; a symbolic link in its place is a failure. */
int WEZOEAMKDir(int flags, const char* szPath);

/* Non-zero when the volume holding szPath has room for cbNeeded more bytes (flags is 0). Zero
 * when it has not, with WLIBC_ERR_NO_SPACE or WLIBC_ERR_OVER_QUOTA in the last-error slot, and
 * zero with another error number when the question could not be answered. */
int WEZOQuotaIsEnough(int flags, const char* szPath, unsigned long long cbNeeded);

/* ---- Last error -------------------------------------------------------------------------- */

/* The error number of the platform's last failure in this thread, 0 when none. */
int WLIBCErrGet(void);

/* The source file (never null; "" when none) and line that recorded the last error. */
const char* WLIBCErrorGetFile(void);
int WLIBCErrorGetLine(void);

/* Records code as the last error, with the source file and line that report it. */
void WLIBCErrSetEx(int code, const char* szFile, int line);

/* ---- Program execution ------------------------------------------------------------------- */

/* Runs the program szPath with up to four arguments (the first null argument ends the list; the
 * program's own name is passed as argv[0]) and waits for it. No shell is involved. Returns 0
 * when the program ran and exited with status 0, non-zero otherwise. */
int WLIBCExec(const char* szPath, const char* szArg1, const char* szArg2, const char* szArg3,
              const char* szArg4);

/* Runs the program szPath with the argument vector argv (argv[0] first, ended by a null entry)
 * and waits for it; flags is 1. Same results as WLIBCExec. */
int WLIBCExecv(const char* szPath, const char* const argv[], int flags);

/* ---- Services ---------------------------------------------------------------------------- */

/* Starts the named service ("fileindexd", "samba"); flags is 1. A running service counts as
 * started. Returns 0 on success, negative with the last error set on failure. */
int WLIBServiceStart(const char* szService, int flags);

/* Stops the named service; flags is 1. A stopped service counts as stopped. Same results. */
int WLIBServiceStop(const char* szService, int flags);

/* Restarts the named service (starts it when it is not running), so that it runs with its current
 * configuration. A platform may have a service that can re-read its configuration in place
 * reload it instead, keeping its clients connected. Same results. */
int WLIBServiceRestart(const char* szService);

/* ---- SMB --------------------------------------------------------------------------------- */

/* 1 when Spotlight search over SMB is switched on, 0 when off, negative when it cannot be told. */
int WEZOSMBIsEnableSpotlight(void);

/* Switches Spotlight over SMB on (non-zero) or off (0) in the SMB configuration; the SMB service
 * takes it up once restarted (WLIBServiceRestart). Returns 0 on success, negative with the last error
 * set on failure. */
int WEZOSMBSetSpotlight(int fEnable);

/* ---- Text -------------------------------------------------------------------------------- */

/* Compares two UTF-8 strings without regard to case: negative, zero or positive as szA sorts
 * before, with or after szB. Invalid UTF-8 is compared byte by byte. */
int WLIBCUnicodeUTF8StrCaseCmp(const char* szA, const char* szB);

#ifdef __cplusplus
} /* extern "C" */
#endif

#endif /* WEZO_PLATFORM_H_ */
