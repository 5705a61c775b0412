// sp<T>: strong pointer for RefBase-derived objects.
#pragma once
#include <cstddef>

namespace android {

template <typename T>
class sp {
public:
    sp() : m_ptr(nullptr) {}
    sp(std::nullptr_t) : m_ptr(nullptr) {}  // NOLINT(google-explicit-constructor)
    sp(T* other) : m_ptr(other) {           // NOLINT(google-explicit-constructor)
        if (m_ptr) m_ptr->incStrong(this);
    }
    sp(const sp<T>& other) : m_ptr(other.m_ptr) {
        if (m_ptr) m_ptr->incStrong(this);
    }
    sp(sp<T>&& other) noexcept : m_ptr(other.m_ptr) { other.m_ptr = nullptr; }
    template <typename U>
    sp(const sp<U>& other) : m_ptr(other.get()) {  // NOLINT(google-explicit-constructor)
        if (m_ptr) m_ptr->incStrong(this);
    }
    ~sp() {
        if (m_ptr) m_ptr->decStrong(this);
    }

    sp& operator=(const sp<T>& other) {
        T* p = other.m_ptr;
        if (p) p->incStrong(this);
        if (m_ptr) m_ptr->decStrong(this);
        m_ptr = p;
        return *this;
    }
    sp& operator=(sp<T>&& other) noexcept {
        if (this != &other) {
            if (m_ptr) m_ptr->decStrong(this);
            m_ptr = other.m_ptr;
            other.m_ptr = nullptr;
        }
        return *this;
    }
    sp& operator=(T* other) {
        if (other) other->incStrong(this);
        if (m_ptr) m_ptr->decStrong(this);
        m_ptr = other;
        return *this;
    }
    sp& operator=(std::nullptr_t) {
        clear();
        return *this;
    }

    void clear() {
        T* p = m_ptr;
        m_ptr = nullptr;
        if (p) p->decStrong(this);
    }

    T& operator*() const { return *m_ptr; }
    T* operator->() const { return m_ptr; }
    T* get() const { return m_ptr; }
    explicit operator bool() const { return m_ptr != nullptr; }

    bool operator==(const T* o) const { return m_ptr == o; }
    bool operator!=(const T* o) const { return m_ptr != o; }
    bool operator==(std::nullptr_t) const { return m_ptr == nullptr; }
    bool operator!=(std::nullptr_t) const { return m_ptr != nullptr; }
    template <typename U>
    bool operator==(const sp<U>& o) const { return m_ptr == o.get(); }
    template <typename U>
    bool operator!=(const sp<U>& o) const { return m_ptr != o.get(); }

private:
    T* m_ptr;
};

}  // namespace android
