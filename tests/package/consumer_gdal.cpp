// Registers the GDAL component's elevation kind through the installed library.
#include <algorithm>
#include <cstdio>
#include <string>

#include <lumo_gdal.h>

int main() {
    lumo::gdal::Initialize();
    const auto kinds = nova::dem::DEMFactory::GetKinds();
    const bool bFound = std::find(kinds.begin(), kinds.end(), "gdal") != kinds.end();
    std::printf("lumo::gdal: elevation kind gdal %s\n", bFound ? "registered" : "missing");
    return bFound ? 0 : 1;
}
