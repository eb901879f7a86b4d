#pragma once

// Every public header of the library. Scripts/check keeps this list whole.
#include "libkernel/core/BaseCharTraits.h"
#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Countable.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Exception.h"
#include "libkernel/core/Export.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/Limits.h"
#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"
#include "libkernel/serialisation/SerialisationStrategy.h"
#include "libkernel/streams/InOutStream.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"
#include "libkernel/streams/SeekMethod.h"
#include "libkernel/streams/StreamCopyProgress.h"
