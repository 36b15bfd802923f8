// A vector of owned objects, also available as a plain vector of pointers.
#pragma once

#include <memory>
#include <vector>

template <class T>
class OwnedList {
public:
  OwnedList() = default;
  OwnedList(const OwnedList &) = delete;
  OwnedList &operator=(const OwnedList &) = delete;
  ~OwnedList() {
    for (T *item : items_)
      delete item; // GCOVR_EXCL_BR_LINE: none is null
  }

  void append(std::unique_ptr<T> item) {
    items_.push_back(item.get());
    static_cast<void>(item.release());
  }

  /// The objects stay owned by the list. A caller may reorder them, but not add or remove any.
  std::vector<T *> *items() { return &items_; }
  const std::vector<T *> *items() const { return &items_; }

private:
  std::vector<T *> items_;
};
