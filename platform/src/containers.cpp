// String lists, string hashes and splitting.
#include "containers.h"
#include "platform.h"

#include <memory>

using platform::guarded;

PLATCSZLIST *PLATCSzListAlloc(int capacity) {
    return guarded(
        [&]() -> PLATCSZLIST * {
            auto list = std::make_unique<PLATCSZLIST>();
            list->texts.reserve(capacity > 0 ? static_cast<size_t>(capacity) : 0);
            return list.release();
        },
        nullptr);
}

void PLATCSzListFree(PLATCSZLIST *pList) {
    delete pList;
}

int PLATCSzListPush(PLATCSZLIST **ppList, const char *szText) {
    if (!ppList || !*ppList || !szText) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return (*ppList)->texts.emplace_back(szText), 0; }, -1);
}

const char *PLATCSzListGet(const PLATCSZLIST *pList, int index) {
    if (!pList || index < 0 || static_cast<size_t>(index) >= pList->texts.size()) {
        return nullptr;
    }
    return pList->texts[static_cast<size_t>(index)].c_str();
}

int PLATCStrSep(const char *szText, const char *szSeparators, PLATCSZLIST **ppList) {
    if (!szText || !szSeparators || !ppList || !*ppList) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            auto &texts = (*ppList)->texts;
            texts.clear();
            for (const char *at = szText + std::strspn(szText, szSeparators); *at != '\0';) {
                const size_t length = std::strcspn(at, szSeparators);
                texts.emplace_back(at, length);
                at += length;
                at += std::strspn(at, szSeparators);
            }
            return static_cast<int>(texts.size());
        },
        -1);
}

PLATCSZHASH *PLATCSzHashAlloc(int /*capacity*/) {
    return guarded([] { return std::make_unique<PLATCSZHASH>().release(); }, nullptr);
}

void PLATCSzHashFree(PLATCSZHASH *pHash) {
    delete pHash;
}

void PLATCHashRemoveAll(PLATCSZHASH *pHash) {
    if (pHash) {
        pHash->pairs.clear();
    }
}

int PLATCSzHashSetValue(PLATCSZHASH **ppHash, const char *szKey, const char *szValue) {
    if (!ppHash || !*ppHash || !szKey || !szValue) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return (*ppHash)->pairs.insert_or_assign(szKey, szValue), 0; }, -1);
}

char *PLATCSzHashGetValue(PLATCSZHASH *pHash, const char *szKey) {
    if (!pHash || !szKey) {
        return nullptr;
    }
    const auto found = pHash->pairs.find(std::string_view(szKey));
    return found == pHash->pairs.end() ? nullptr : found->second.data();
}

int PLATCSzHashEnumKey(const PLATCSZHASH *pHash, PLATCSZLIST **ppList) {
    if (!pHash || !ppList || !*ppList) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            auto &texts = (*ppList)->texts;
            texts.clear();
            for (const auto &pair : pHash->pairs) {
                texts.push_back(pair.first);
            }
            return static_cast<int>(texts.size());
        },
        -1);
}
