#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/// A list of texts. Not safe for use from several threads at once.
typedef struct KLIBCSzList KLIBCSzList;

/// An empty list with room for `size` texts (it grows); null on failure. Freed with
/// KLIBCSzListFree, which allows null.
KLIBCSzList* KLIBCSzListAlloc(int size);

/// Frees the list and its texts.
void KLIBCSzListFree(KLIBCSzList* list);

/// Appends a copy of the text. Negative on failure.
int KLIBCSzListPush(KLIBCSzList** list, const char* text);

/// The text at a position, counted from 0; null beyond the end. It lives until the list changes.
const char* KLIBCSzListGet(const KLIBCSzList* list, int position);

/// The position of the text in the list, negative when it is not there.
int KLIBCSzListFind(const KLIBCSzList* list, const char* text);

#ifdef __cplusplus
}
#endif
