// A host program as small as can be, built against the installed library alone.
#include <libkernel/libkernel.h>

#include <cstdio>

int main()
{
    Kernel::Path const path = Kernel::Path::Join({"", "a", "b"});
    std::puts(Kernel::Format("%1 of %2", path.GetString(), 2).GetData());
}
