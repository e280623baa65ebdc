#pragma once
// Object and RefObject: the roots of host and tool classes, and Ref<T>, the
// RAII handle over Use/Recycle.
//
// A RefObject starts with one reference, owned by whoever made it. Use() adds
// one, Recycle() drops one and deletes the object at zero. Tool code holds
// references through Ref<T> so that no path can leak one.
//
// Thread safety: Use and Recycle are atomic; everything else is the class's own.
#include <atomic>
#include <utility>

#include "host/core/Reuser.h"
#include "host/core/TagList.h"

namespace Orvane {

class Registry;
class ScriptInfo;

class ORVANE_API Object : public Reuser {
public:
    Object() = default;
    Object(const Object &) = delete;
    Object &operator=(const Object &) = delete;
    virtual ~Object();

    /// The registry row the object was made from, or null for host-made objects.
    const Registry *GetRegistry() const { return registry_; }
    void SetRegistry(const Registry *reg) { registry_ = reg; }

    /// Bytes the object holds, for memory accounting.
    virtual size_t SizeOf() const { return sizeof(Object); }

    /// Class-level start-up and shut-down, reached through RegInitFunc and
    /// RegCleanupFunc; a false result drops the class.
    static bool RegInit(Registry *reg);
    static void RegCleanup(Registry *reg);

private:
    const Registry *registry_ = nullptr;
};

class ORVANE_API RefObject : public Object {
public:
    void Use() const { refs_.fetch_add(1, std::memory_order_relaxed); }
    void Recycle() const {
        if (refs_.fetch_sub(1, std::memory_order_acq_rel) == 1) delete this;
    }
    int RefCount() const { return refs_.load(std::memory_order_relaxed); }

    /// Attributes of the object (image attributes, application switches).
    bool GetAttrB(Tag tag, bool def = false) const { return attrs_.GetBool(tag, def); }
    long long GetAttrL(Tag tag, long long def = 0) const { return attrs_.GetLong(tag, def); }
    double GetAttrD(Tag tag, double def = 0.0) const { return attrs_.GetDouble(tag, def); }
    void SetAttrsTagList(const TagList &tags) {
        attrs_.Merge(tags);
        attrs_.Persist();
    }
    const TagList &Attrs() const { return attrs_; }

protected:
    ~RefObject() override;
    TagList attrs_;

private:
    mutable std::atomic<int> refs_{1};
};

/// Owning handle: holds one reference and drops it when it goes.
template <class T> class Ref {
public:
    Ref() = default;
    Ref(std::nullptr_t) {}
    /// Shares `p`: adds a reference.
    explicit Ref(T *p) : p_(p) {
        if (p_) p_->Use();
    }
    /// Takes over the reference a maker returned, without adding one.
    static Ref Adopt(T *p) {
        Ref r;
        r.p_ = p;
        return r;
    }
    Ref(const Ref &o) : Ref(o.p_) {}
    Ref(Ref &&o) noexcept : p_(std::exchange(o.p_, nullptr)) {}
    template <class U> Ref(const Ref<U> &o) : Ref(o.Get()) {}
    template <class U> Ref(Ref<U> &&o) noexcept : p_(o.Release()) {}
    Ref &operator=(Ref o) noexcept {
        std::swap(p_, o.p_);
        return *this;
    }
    ~Ref() {
        if (p_) p_->Recycle();
    }

    T *Get() const { return p_; }
    T *operator->() const { return p_; }
    T &operator*() const { return *p_; }
    explicit operator bool() const { return p_ != nullptr; }
    /// Hands the reference to the caller.
    T *Release() { return std::exchange(p_, nullptr); }
    void Reset() { *this = Ref(); }

    friend bool operator==(const Ref &a, const Ref &b) { return a.p_ == b.p_; }

private:
    T *p_ = nullptr;
};

template <class T, class... Args> Ref<T> MakeRef(Args &&...args) {
    return Ref<T>::Adopt(new T(std::forward<Args>(args)...));
}

} // namespace Orvane
