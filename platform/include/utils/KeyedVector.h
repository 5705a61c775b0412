// Map kept sorted by key on a SortedVector, looked up by binary search.
#pragma once
#include <sys/types.h>

#include <utils/SortedVector.h>
#include <log/log.h>

#include <cstdlib>

namespace android {

template <typename KEY, typename VALUE>
class KeyedVector {
public:
    size_t size() const { return mVector.size(); }
    bool isEmpty() const { return mVector.isEmpty(); }
    void clear() { mVector.clear(); }

    ssize_t indexOfKey(const KEY& key) const { return mVector.indexOf(Pair(key)); }
    // The value under key; a missing key is a programming error and aborts, as on the device.
    const VALUE& valueFor(const KEY& key) const {
        ssize_t i = indexOfKey(key);
        if (i < 0) {
            __android_log_print(ANDROID_LOG_FATAL, "KeyedVector", "%s: key not found", __func__);
            abort();
        }
        return mVector.itemAt(static_cast<size_t>(i)).value;
    }
    const VALUE& valueAt(size_t index) const { return mVector.itemAt(index).value; }
    const KEY& keyAt(size_t index) const { return mVector.itemAt(index).key; }
    VALUE& editValueAt(size_t index) { return mVector.editItemAt(index).value; }

    ssize_t add(const KEY& key, const VALUE& value) { return mVector.add(Pair(key, value)); }
    ssize_t replaceValueFor(const KEY& key, const VALUE& value) { return add(key, value); }
    ssize_t removeItem(const KEY& key) { return mVector.remove(Pair(key)); }
    ssize_t removeItemsAt(size_t index, size_t count = 1) { return mVector.removeItemsAt(index, count); }

private:
    struct Pair {
        KEY key;
        VALUE value;
        explicit Pair(const KEY& k) : key(k), value() {}
        Pair(const KEY& k, const VALUE& v) : key(k), value(v) {}
        bool operator<(const Pair& o) const { return key < o.key; }
    };
    SortedVector<Pair> mVector;
};

}  // namespace android
