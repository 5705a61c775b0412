// Vector kept sorted by value, searched by binary search.
#pragma once
#include <sys/types.h>

#include <algorithm>
#include <vector>

#include <utils/Errors.h>

namespace android {

template <class TYPE>
class SortedVector {
public:
    size_t size() const { return mItems.size(); }
    bool isEmpty() const { return mItems.empty(); }
    void clear() { mItems.clear(); }

    // Index of the item, or NAME_NOT_FOUND.
    ssize_t indexOf(const TYPE& item) const {
        auto it = std::lower_bound(mItems.begin(), mItems.end(), item);
        if (it == mItems.end() || item < *it) return NAME_NOT_FOUND;
        return static_cast<ssize_t>(it - mItems.begin());
    }
    // Adds or replaces the item; returns its index.
    ssize_t add(const TYPE& item) {
        auto it = std::lower_bound(mItems.begin(), mItems.end(), item);
        if (it != mItems.end() && !(item < *it)) {
            *it = item;
        } else {
            it = mItems.insert(it, item);
        }
        return static_cast<ssize_t>(it - mItems.begin());
    }
    ssize_t remove(const TYPE& item) {
        ssize_t i = indexOf(item);
        if (i >= 0) mItems.erase(mItems.begin() + i);
        return i;
    }
    ssize_t removeItemsAt(size_t index, size_t count = 1) {
        if (index + count > mItems.size()) return BAD_VALUE;
        mItems.erase(mItems.begin() + static_cast<ssize_t>(index),
                     mItems.begin() + static_cast<ssize_t>(index + count));
        return static_cast<ssize_t>(index);
    }
    const TYPE& itemAt(size_t index) const { return mItems[index]; }
    const TYPE& operator[](size_t index) const { return mItems[index]; }
    TYPE& editItemAt(size_t index) { return mItems[index]; }

private:
    std::vector<TYPE> mItems;
};

}  // namespace android
