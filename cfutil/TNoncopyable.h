// TNoncopyable: an empty base class that makes its derived class impossible to copy. Owning
// wrappers that must never share their single count derive from it; it adds no storage.
#pragma once

class TNoncopyable {
public:
    TNoncopyable() = default;
    ~TNoncopyable() = default;
    TNoncopyable(const TNoncopyable&) = delete;
    TNoncopyable& operator=(const TNoncopyable&) = delete;
};
