// A separate program that uses the installed library through one include
// folder and one header: evaluates a polynomial model, counts a warning and
// catches a fatal error as a caller has to.
#include <cstdio>
#include <type_traits>

#include <lumo.h>

namespace {

int Fail(const char* what) {
    std::printf("consumer: %s\n", what);
    return 1;
}

}  // namespace

int main() {
    static_assert(
        std::is_same<std::underlying_type<nova::mathmodel::LumoModelType>::type, int>::value,
        "LumoModelType has a fixed underlying type");
    if (nova::mathmodel::ModelCodeToLumoType(99) != nova::mathmodel::LUMO_MODEL_NONE) {
        return Fail("model code 99 has a family");
    }

    POLYInfo_t* psPoly = POLYAllocate();
    // A record without terms evaluates with warning 11, which the sink takes.
    int nWarnings = 0;
    const nova::ErrorSink previous = nova::SetErrorSink(
        [&nWarnings](const nova::ErrorReport& r) { nWarnings += r.nCode == 11; });
    nova::ResetWarningCount();
    double dfPixel = 0.0, dfLine = 0.0;
    POLYGeo2Img(psPoly, 1.0, 2.0, &dfPixel, &dfLine);
    nova::SetErrorSink(previous);
    if (nWarnings != 1 || nova::GetWarningCount() != 1) return Fail("warning 11 not counted");

    psPoly->nCoeffs = 3;
    psPoly->padfPixelCoeffs[1] = 2.0;
    const int nOk = GenGeo2Img(LUMO_CODE_POLY, psPoly, 21.0, 0.0, 0.0, &dfPixel, &dfLine);
    POLYDeallocate(psPoly);
    if (nOk != 1 || dfPixel != 42.0) return Fail("polynomial evaluation");

    // A fatal error ends the operation with an exception carrying its number.
    SRITInfo_t* psModel = SRITAllocate();
    int nCode = 0;
    try {
        SRITCalculate(psModel, true, nullptr, 3, nullptr, nullptr, nullptr, nullptr, nullptr,
                      nullptr);
    } catch (const nova::NumberedError& e) {
        nCode = e.GetCode();
    }
    LumoFreeSRITInfo(psModel);
    if (nCode != 100) return Fail("the fatal error was not caught as number 100");
    std::printf("lumo %s: %g, fatal error %d caught\n", LumoVersion(), dfPixel, nCode);
    return 0;
}
