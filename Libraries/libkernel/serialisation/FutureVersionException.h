#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/IDTag.h"

namespace Kernel {

/// A property stream that this version can't read. A plain value, outside the family of Exception, thrown by the
/// parse operations of InSerialiserFile.
class KERNEL_API FutureVersionException
{
public:
    /// @p refused: see WasRefused.
    explicit FutureVersionException(bool refused) : m_refused(refused) {}
    FutureVersionException(FutureVersionException const&) = default;
    FutureVersionException& operator=(FutureVersionException const&) = default;
    virtual ~FutureVersionException();

    /// False for a format, a property type or a class that is too new; true for an object whose Load gave false.
    bool WasRefused() const { return m_refused; }

private:
    bool m_refused;
};

/// A parse with checks met a class that is not registered.
class KERNEL_API UnknownClassUIDException : public FutureVersionException
{
public:
    explicit UnknownClassUIDException(ClassUID uid) : FutureVersionException(false), m_uid(uid) {}
    ~UnknownClassUIDException() override;

    /// The class that the stream names and the program lacks.
    ClassUID GetClassUID() const { return m_uid; }

private:
    ClassUID m_uid;
};

} // namespace Kernel
