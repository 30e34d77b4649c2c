// Whether the machine can be switched on by a schedule.
#include "sched_error.h"
#include "tavischeduler.h"
#include "tavisdk.h"

#pragma weak TAVIAutoPoweronCheck // an appliance's own platform may lack it

int TAVISchedPowerOnCheck(char *szReason, size_t cbReason) {
    SCHED_REQUIRE(szReason, "((void *)0) != szReason", -1);
    SCHED_REQUIRE(cbReason > 0, "0 < cbReason", -1);
    szReason[0] = '\0';
    return TAVIAutoPoweronCheck && TAVIAutoPoweronCheck(szReason, cbReason) != 0 ? 1 : 0;
}
