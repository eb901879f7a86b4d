#pragma once

#include "libkernel/concurrency/CriticalSection.h"

// The order of an archive's locks. A thread that holds one may take only those further down; debug builds assert it.
//
//   session       one maker or closer of a session at a time; held through a commit
//   (file store   the store's lock, a holder's owners lock, a holder's item lock, in that order: loads run under the
//                 item lock and take what stands below; a commit takes them with nothing but the session lock held)
//   access        access count, suspension, adorners, opening and closing of handles
//   master        the master's stream and writes
//   scratch       the scratch file's stream and writes
//   state         revisions, path map, path counts, rewind count, reader count
//   bucket store  the list of back data buckets
//   bucket        one bucket's write position
//   leaf          spin locks over a few fields: a session's queue, offlining state, flags
//
// Two roads that would cross it are bent. A commit takes the state lock inside the file's, so a copy into back data,
// which starts from the state, notes what it needs under the state lock, lets go, reads the file, and takes the state
// lock again to publish. Reading never takes the session lock: what it asked there (has the file been moved away, is a
// session active) is answered under the access and state locks.
//
// A streamline holds the session lock throughout, and keeps readers out by a gate (ArchiveReadGate), which is a counter
// under the state lock and no lock itself: whoever waits at it holds nothing of the archive. While it puts a new file
// in the master's place it holds the access lock, so that nobody opens what is just being moved. Owners of holders are
// told afterwards, with only the session lock and the gate held.

namespace Kernel {

inline constexpr LockRank c_rankSession{100};
inline constexpr LockRank c_rankAccess{500};
inline constexpr LockRank c_rankMaster{600};
inline constexpr LockRank c_rankScratch{610};
inline constexpr LockRank c_rankState{700};
inline constexpr LockRank c_rankBucketStore{800};
inline constexpr LockRank c_rankBucket{810};
inline constexpr LockRank c_rankLeaf{900};

} // namespace Kernel
