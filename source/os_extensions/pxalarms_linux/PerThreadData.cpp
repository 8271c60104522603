// PerThreadData.cpp - the current-structure key.
#include "PerThreadData.h"

#include "pxAssert.h"

namespace pxalarms {

CurrentStructureKey::CurrentStructureKey()
{
    // No destructor: the key points into the alarm table, which owns records.
    const int rc = pthread_key_create(&key_, nullptr);
    PX_ASSERT(rc == 0);
}

CurrentStructureKey::~CurrentStructureKey()
{
    pthread_key_delete(key_);
}

}  // namespace pxalarms
