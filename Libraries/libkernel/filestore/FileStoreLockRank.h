#pragma once

#include "libkernel/concurrency/CriticalSection.h"

namespace Kernel {

/// The order in which the short locks of this folder are taken, behind every lock that a concrete store ranks. Nothing
/// virtual is called and no object is released under one of them. A holder's load lock stands outside: it is taken
/// before any lock of a store, and finds circles by itself.
namespace FileStoreLockRank {
constexpr LockRank c_link{0xF000};         ///< A link's pointer to its store's memory.
constexpr LockRank c_store{0xF100};        ///< A store's maps of paths and holders.
constexpr LockRank c_owners{0xF200};       ///< A holder's map of owners.
constexpr LockRank c_item{0xF300};         ///< A holder's item, loaded flag and back data.
constexpr LockRank c_holderOfItem{0xF400}; ///< An item's pointer to its holder.
constexpr LockRank c_state{0xF500};        ///< An object's dirty states.
} // namespace FileStoreLockRank

} // namespace Kernel
