// Growable string lists and tokenising into them.
#include <cstring>
#include <new>

#include "platform/navocore.h"

NLIBCSzList *NLIBCSzListAlloc(int capacity) noexcept {
    try {
        auto *list = new NLIBCSzList;
        list->items.reserve(capacity > 0 ? static_cast<size_t>(capacity) : 0);
        return list;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return nullptr;
    }
}

void NLIBCSzListFree(NLIBCSzList *list) noexcept {
    delete list;
}

int NLIBCSzListCount(const NLIBCSzList *list) noexcept {
    return list != nullptr ? static_cast<int>(list->items.size()) : 0;
}

const char *NLIBCSzListGet(const NLIBCSzList *list, int index) noexcept {
    if (list == nullptr || index < 0 || static_cast<size_t>(index) >= list->items.size())
        return nullptr;
    return list->items[static_cast<size_t>(index)].c_str();
}

int NLIBCSzListPush(NLIBCSzList *list, const char *text) noexcept {
    if (list == nullptr || text == nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        list->items.emplace_back(text);
        return 0;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}

int NLIBCStrTok(const char *text, const char *delims, NLIBCSzList *list) noexcept {
    if (text == nullptr || delims == nullptr || list == nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        int added = 0;
        for (const char *p = text; *p != '\0';) {
            size_t len = std::strcspn(p, delims);
            if (len > 0) {
                list->items.emplace_back(p, len);
                ++added;
            }
            p += len;
            if (*p != '\0')
                ++p;
        }
        return added;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}
