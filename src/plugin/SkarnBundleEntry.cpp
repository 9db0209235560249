// The plug-in library's only exported symbol: the principal class entry the
// Vesta bundle loader resolves.
#include "SkarnFactory.h"
#include "VestaKilnProtocols.h"

extern "C" __attribute__((visibility("default"))) VestaKilnPluginRegisterBundle* VestaKilnPrincipalClass_SkarnFactory() {
    return SkarnFactory::factory().detach();
}
