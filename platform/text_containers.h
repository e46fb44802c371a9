// String lists, string hashes and text helpers: the platform's own containers of zero-terminated
// text.
//
// Both containers grow as needed and hold copies of what is put into them; what they hand out
// belongs to them and lives until the next change or release. Putting something in may move the
// record, so these operations take the address of the caller's own pointer and keep it up to date.
// A container belongs to one thread at a time.
//
// A failure sets the last error (last_error.h). A null text or container is a failure, and so is an
// empty delimiter, unless a declaration says otherwise.

#ifndef ZELO_PLATFORM_TEXT_CONTAINERS_H
#define ZELO_PLATFORM_TEXT_CONTAINERS_H

#include "api.h"

// The first field of both records is the caller's to read, and only to read; what follows it is the
// port's.

struct YLIBSZLIST_ITEMS;
// A list of texts.
struct YLIBSZLIST {
    int nItem;                 // how many texts it holds
    YLIBSZLIST_ITEMS *pItems;  // the port's
};

struct YLIBSZHASH_PAIRS;
// Pairs of texts.
struct YLIBSZHASH {
    int nItem;                 // how many pairs it holds
    YLIBSZHASH_PAIRS *pPairs;  // the port's
};

extern "C" {

// --- Lists --------------------------------------------------------------------------------------

// A new empty list with room for about cbInitial bytes; it grows past them. Null when memory is
// short or cbInitial is negative. The caller owns it and releases it with YLIBCSzListFree.
ZELO_PLATFORM_API YLIBSZLIST *YLIBCSzListAlloc(int cbInitial);

// Releases a list; null is no error.
ZELO_PLATFORM_API void YLIBCSzListFree(YLIBSZLIST *pslList);

// Appends a copy of the text. Returns its index, or a negative value on failure, with the list as
// it was.
ZELO_PLATFORM_API int YLIBCSzListPush(YLIBSZLIST **ppslList, const char *szText);

// The text at an index from 0 to nItem - 1; null for any other index or a null list.
ZELO_PLATFORM_API const char *YLIBCSzListGet(const YLIBSZLIST *pslList, int index);

// --- Hashes -------------------------------------------------------------------------------------

// A new empty hash with room for about cbInitial bytes; it grows past them. Null when memory is
// short or cbInitial is negative. The caller owns it and releases it with YLIBCSzHashFree.
ZELO_PLATFORM_API YLIBSZHASH *YLIBCSzHashAlloc(int cbInitial);

// Releases a hash; null is no error.
ZELO_PLATFORM_API void YLIBCSzHashFree(YLIBSZHASH *pHash);

// Puts a copy of the pair into the hash; a key that is there gets the new value and keeps its
// place. Returns 0 or more on success and a negative value on failure, with the hash as it was.
ZELO_PLATFORM_API int YLIBCSzHashSetValue(YLIBSZHASH **ppHash, const char *szKey,
                                          const char *szValue);

// The value of a key; null when the key is not there. An empty value is not null.
ZELO_PLATFORM_API const char *YLIBCSzHashGetValue(const YLIBSZHASH *pHash, const char *szKey);

// The pairs one by one, in the order in which their keys came: key and value at an index from 0 to
// nItem - 1; null for any other index or a null hash.
ZELO_PLATFORM_API const char *YLIBCSzHashKeyAt(const YLIBSZHASH *pHash, int index);
ZELO_PLATFORM_API const char *YLIBCSzHashValueAt(const YLIBSZHASH *pHash, int index);

// --- Text ---------------------------------------------------------------------------------------

// Appends the pieces of szText between the delimiters to the list; szDelimiter is one text, found
// as a whole. Two delimiters side by side have an empty piece between them; an empty szText has no
// piece. Returns the number of pieces, or -1 on failure (also when a piece could not be appended;
// the earlier ones are then in the list).
ZELO_PLATFORM_API int YLIBCStrTok(const char *szText, const char *szDelimiter,
                                  YLIBSZLIST **ppslList);

// Takes the next piece from a text: returns *pszText, ended in place at the first szDelimiter, and
// moves *pszText past that delimiter. Without a delimiter it returns the whole rest, and *pszText
// becomes null. Returns null when *pszText is null, which is no failure.
ZELO_PLATFORM_API char *YLIBCStrTokIndex(char **pszText, const char *szDelimiter);

// Writes szText without the characters of szSet at both ends to szOut, which may be szText itself
// and otherwise has room for all of it. Returns the length written, 0 when nothing is left, and a
// negative value, with szOut as it was, on failure.
ZELO_PLATFORM_API int YLIBCStrTrim(const char *szText, char *szOut, const char *szSet);

// Replaces every occurrence of szOld in szText, a buffer of cbText bytes, by szNew: one pass from
// left to right, which does not look again at what it has put in. A result that does not fit
// changes nothing; the text never goes past cbText - 1 bytes.
//
// Returns the number of occurrences replaced, 0 when there is none (an empty szOld has none), and a
// negative value when the result does not fit or szText does not end within cbText bytes. flags is
// reserved: callers pass 0, a port ignores it.
ZELO_PLATFORM_API int YLIBCStrReplace(char *szText, const char *szOld, const char *szNew, int flags,
                                      int cbText);
}

#endif
