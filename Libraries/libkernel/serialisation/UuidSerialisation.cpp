#include "libkernel/core/Uuid.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/OutSerialiser.h"

namespace Kernel {

void Uuid::Save(OutSerialiser& out, IDTag const& tag) const
{
    out.SaveRawStructI(tag, m_bytes.data(), m_bytes.size());
}

bool Uuid::Load(InSerialiser const& in, IDTag const& tag)
{
    return in.LoadRawStructI(tag, m_bytes.data(), m_bytes.size());
}

} // namespace Kernel
