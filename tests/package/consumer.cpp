// Evaluates a polynomial model through the installed library.
#include <cstdio>

#include <lumo.h>

int main() {
    POLYInfo_t* psPoly = POLYAllocate();
    psPoly->nCoeffs = 3;
    psPoly->padfPixelCoeffs[1] = 2.0;
    double dfPixel = 0.0, dfLine = 0.0;
    const int nOk = GenGeo2Img(4, psPoly, 21.0, 0.0, 0.0, &dfPixel, &dfLine);
    POLYDeallocate(psPoly);
    std::printf("lumo %s: %g\n", LumoVersion(), dfPixel);
    return nOk == 1 && dfPixel == 42.0 ? 0 : 1;
}
