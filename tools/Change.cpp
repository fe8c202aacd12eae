#include "Change.h"

#include "Audit.h"
#include "Place.h"

namespace {

bool g_blChanged = false;

} // namespace

namespace tool {

void settleChange()
{
    g_blChanged = true;
    audit::made();
    syncDirectory("the change was made, but a power cut can undo it");
}

bool hasChanged()
{
    return g_blChanged;
}

} // namespace tool
