// SPDX-License-Identifier: BSD-2-Clause
//
// What every component of a data set answers and does. A component is read from
// the file system when it is built and never changes afterwards.
#pragma once

#include <string>
#include <utility>

class mln_dataset_component {
 public:
  // Whether this component's data can be used together with `other`, the
  // component at the same position in another data set.
  virtual bool compatible_schema(const mln_dataset_component& other) const = 0;

  // Replaces this component's link by one to its own data, or by none if the
  // data is found without a link. Throws the errno of a link that could not be
  // created.
  virtual void activate() const = 0;

  // The directory of the data set, as given; empty: the system partition.
  std::string dataset_path;

 protected:
  mln_dataset_component() = default;
  explicit mln_dataset_component(std::string path)
      : dataset_path(std::move(path)) {}

  // Deliberate: not virtual, because components are held only by shared
  // pointers made from the concrete type, which destroy it as that type.
  // Protected, so that deleting one through the base does not compile. Pinned
  // by ComponentOwnership.CannotBeDeletedThroughTheBase.
  ~mln_dataset_component() = default;
};
