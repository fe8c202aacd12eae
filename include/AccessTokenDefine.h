// The constants that callers share with the library, and the mark of what it exports.

#ifndef VEMO_ACCESS_TOKEN_DEFINE_H
#define VEMO_ACCESS_TOKEN_DEFINE_H

// Marks the classes and functions that the shared object exports; all else in it is hidden.
#define VEMO_ATOKEN_EXPORT __attribute__((visibility("default")))

// The one database file. Every process of the machine that uses tokens uses this file.
#define VEMO_ATOKEN_DB_PATH "/usr/vemo/etc/private/session/vemo-access-token.db"

// The least length, in bytes, of a token id that a caller chooses. Generated ids are long
// enough: they have 127 to 255 characters.
#define VEMO_ATOKEN_LENGTH_MIN 127

// The uid that means no user, (uid_t)-1. No token is created for it.
#ifndef UID_ERR
#define UID_ERR 4294967295U
#endif

#endif
