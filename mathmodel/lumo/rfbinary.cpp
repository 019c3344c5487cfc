// The rational function binary form: a 3584-byte block of fixed-width text
// fields. Each field is written as a terminated text over a block of spaces,
// so a field's terminator survives only where no later field overwrites it;
// the reader takes every field by offset and width and stops at a NUL.
#include <strings.h>
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

#include "errors.h"
#include "lumo_rf.h"
#include "projection.h"
#include "runtime.h"

namespace {

constexpr const char* kMagic = "RFMODEL ";
constexpr int kMagicLength = 8;
constexpr int kShiftFlagAt = 8;
constexpr int kDownsampleMarkerAt = 22;
constexpr int kDownsampleAt = 24;
constexpr int kDownsampleWidth = 3;
constexpr int kLayoutMarkerAt = 27;
constexpr int kSensorMarkerAt = 30;
constexpr int kSensorAt = 36;
constexpr int kTextChars = RF_TEXT_SIZE - 1;  // 16

constexpr int kNumericAt = 512;
constexpr int kTermsWidth = 4;
constexpr int kExtra1At = 516;
constexpr int kExtra2At = 526;
constexpr int kExtraWidth = 10;
constexpr int kDoublesAt = 536;
constexpr int kDoubleWidth = 22;
constexpr int kRecordDoubles = 22;

// Older layout of the numeric part.
constexpr int kOldIntWidth = 22;
constexpr int kOldExtra1At = 534;
constexpr int kOldExtra2At = 556;
constexpr int kOldDoublesAt = 578;
constexpr int kOldNormalisationDoubles = 10;
constexpr int kOldAdjustTerms = 3;

constexpr int kPixelNumAt = 1024;
constexpr int kPixelDenAt = 1536;
constexpr int kLineNumAt = 2048;
constexpr int kLineDenAt = 2560;
constexpr int kGeosysAt = 3072;
constexpr int kProjParmsAt = 3328;
constexpr int kProjParmsChars = RF_BINARY_SIZE - kProjParmsAt;  // 256

using BlockPtr = std::unique_ptr<unsigned char, nova::FreeDeleter>;
using RecordPtr = std::unique_ptr<RFInfo_t, void (*)(RFInfo_t*)>;

// Writes a terminated text at an offset. Callers size their fields so that
// text and terminator fit the block; a longer text is cut rather than
// written past its end.
void PutText(unsigned char* pabyBlock, int nOffset, const std::string& osText) {
    const std::size_t nRoom = static_cast<std::size_t>(RF_BINARY_SIZE - nOffset - 1);
    const std::size_t nCopy = std::min(osText.size(), nRoom);
    std::memcpy(pabyBlock + nOffset, osText.data(), nCopy);
    pabyBlock[nOffset + nCopy] = '\0';
}

std::string FormatDouble(double dfValue) {
    return nova::FormatString("%22.14e", dfValue);
}

// A text buffer of the record that need not be terminated within its size.
std::string BoundedText(const char* pszText) {
    if (pszText == nullptr) return std::string();
    return std::string(pszText, strnlen(pszText, kTextChars));
}

// The text of a field: at most nWidth characters, ending at the first NUL.
std::string FieldChars(const unsigned char* pabyBlock, int nOffset, int nWidth) {
    const char* pszField = reinterpret_cast<const char*>(pabyBlock + nOffset);
    return std::string(pszField, strnlen(pszField, static_cast<std::size_t>(nWidth)));
}

// Copies a text into one of the record's 17-byte buffers, cut to fit.
void CopyBounded(char* pszBuffer, const std::string& osText) {
    const std::size_t nCopy = std::min(osText.size(), static_cast<std::size_t>(kTextChars));
    std::memcpy(pszBuffer, osText.data(), nCopy);
    pszBuffer[nCopy] = '\0';
}

bool NeedsProjParms(const std::string& osGeosys) {
    return RequiresProjInfo(DecodeGeosys(osGeosys.c_str(), nullptr)) != 0;
}

// Values the writer cannot store without loss: a term count the block has no
// room for, or an integer wider than its field.
bool CanBeWritten(const RFInfo_t* psRF) {
    if (psRF->nTerms < 0 || psRF->nTerms > RF_MAX_TERMS) {
        lumo::WarnReal(lumo::Err::kBadArgument, "RFInfo_t.nTerms", psRF->nTerms, 0);
        return false;
    }
    if (psRF->nDownsample < -99 || psRF->nDownsample > 999) {
        lumo::WarnReal(lumo::Err::kBadArgument, "RFInfo_t.nDownsample", psRF->nDownsample, 0);
        return false;
    }
    // Every int but the most negative fits "%10d".
    constexpr int kMinExtra = -999999999;
    if (psRF->nExtra1 < kMinExtra) {
        lumo::WarnReal(lumo::Err::kBadArgument, "RFInfo_t.nExtra1", psRF->nExtra1, 0);
        return false;
    }
    if (psRF->nExtra2 < kMinExtra) {
        lumo::WarnReal(lumo::Err::kBadArgument, "RFInfo_t.nExtra2", psRF->nExtra2, 0);
        return false;
    }
    return true;
}

void WriteHeader(const RFInfo_t* psRF, unsigned char* pabyBlock) {
    PutText(pabyBlock, 0, kMagic);
    PutText(pabyBlock, kShiftFlagAt, psRF->nHalfPixelShift ? "1" : "0");
    PutText(pabyBlock, kDownsampleMarkerAt, "DS");
    PutText(pabyBlock, kDownsampleAt, nova::FormatString("%3d", psRF->nDownsample));
    PutText(pabyBlock, kLayoutMarkerAt, "2ND");
    const std::string osSensor = BoundedText(psRF->pszSensor);
    if (!osSensor.empty()) {
        PutText(pabyBlock, kSensorMarkerAt, "SENSOR");
        PutText(pabyBlock, kSensorAt, osSensor);
    }
}

// The 22 doubles from dfXOffset to adfLineAdjust[5], in record order.
void RecordDoubles(const RFInfo_t* psRF, double* padfOut) {
    const double adfNormalisation[] = {psRF->dfXOffset,     psRF->dfXScale,     psRF->dfYOffset,
                                       psRF->dfYScale,      psRF->dfZOffset,    psRF->dfZScale,
                                       psRF->dfPixelOffset, psRF->dfPixelScale, psRF->dfLineOffset,
                                       psRF->dfLineScale};
    std::copy(std::begin(adfNormalisation), std::end(adfNormalisation), padfOut);
    std::copy(psRF->adfPixelAdjust, psRF->adfPixelAdjust + RF_ADJUST_TERMS, padfOut + 10);
    std::copy(psRF->adfLineAdjust, psRF->adfLineAdjust + RF_ADJUST_TERMS, padfOut + 16);
}

void SetRecordDoubles(RFInfo_t* psRF, const double* padf) {
    psRF->dfXOffset = padf[0];
    psRF->dfXScale = padf[1];
    psRF->dfYOffset = padf[2];
    psRF->dfYScale = padf[3];
    psRF->dfZOffset = padf[4];
    psRF->dfZScale = padf[5];
    psRF->dfPixelOffset = padf[6];
    psRF->dfPixelScale = padf[7];
    psRF->dfLineOffset = padf[8];
    psRF->dfLineScale = padf[9];
    std::copy(padf + 10, padf + 16, psRF->adfPixelAdjust);
    std::copy(padf + 16, padf + 22, psRF->adfLineAdjust);
}

void WriteNumericPart(const RFInfo_t* psRF, unsigned char* pabyBlock) {
    PutText(pabyBlock, kNumericAt, nova::FormatString("%4d", psRF->nTerms));
    PutText(pabyBlock, kExtra1At, nova::FormatString("%10d", psRF->nExtra1));
    PutText(pabyBlock, kExtra2At, nova::FormatString("%10d", psRF->nExtra2));
    double adfValues[kRecordDoubles];
    RecordDoubles(psRF, adfValues);
    for (int k = 0; k < kRecordDoubles; ++k) {
        PutText(pabyBlock, kDoublesAt + kDoubleWidth * k, FormatDouble(adfValues[k]));
    }
}

void WriteCoefficients(const double* padfCoeffs, int nTerms, int nOffset,
                       unsigned char* pabyBlock) {
    for (int i = 0; i < nTerms; ++i) {
        PutText(pabyBlock, nOffset + kDoubleWidth * i, FormatDouble(padfCoeffs[i]));
    }
}

void WriteGeoreferencing(const RFInfo_t* psRF, unsigned char* pabyBlock) {
    const std::string osGeosys = BoundedText(psRF->pszGeosys);
    // Padded with NULs when shorter than the field; no terminator at 16.
    std::memset(pabyBlock + kGeosysAt, 0, kTextChars);
    std::copy(osGeosys.begin(), osGeosys.end(), pabyBlock + kGeosysAt);
    if (psRF->psProjInfo != nullptr && NeedsProjParms(osGeosys)) {
        std::unique_ptr<char, nova::FreeDeleter> pszParms(ProjInfo2Parms(psRF->psProjInfo));
        PutText(pabyBlock, kProjParmsAt, pszParms ? pszParms.get() : "");
    } else {
        PutText(pabyBlock, kProjParmsAt, "");
    }
}

bool HasCoefficientArrays(const RFInfo_t* psRF) {
    return psRF->padfPixelNum != nullptr && psRF->padfPixelDen != nullptr &&
           psRF->padfLineNum != nullptr && psRF->padfLineDen != nullptr;
}

double ScanField(const unsigned char* pabyBlock, int nOffset, int nWidth) {
    return ScanDouble(reinterpret_cast<const char*>(pabyBlock + nOffset), nWidth);
}

int ScanIntField(const unsigned char* pabyBlock, int nOffset, int nWidth) {
    return ScanInt(reinterpret_cast<const char*>(pabyBlock + nOffset), nWidth);
}

bool MarkerIs(const unsigned char* pabyBlock, int nOffset, const char* pszMarker) {
    return strncasecmp(reinterpret_cast<const char*>(pabyBlock + nOffset), pszMarker,
                       std::strlen(pszMarker)) == 0;
}

void ReadCurrentNumericPart(const unsigned char* pabyBlock, RFInfo_t* psRF) {
    psRF->nExtra1 = ScanIntField(pabyBlock, kExtra1At, kExtraWidth);
    psRF->nExtra2 = ScanIntField(pabyBlock, kExtra2At, kExtraWidth);
    double adfValues[kRecordDoubles];
    for (int k = 0; k < kRecordDoubles; ++k) {
        adfValues[k] = ScanField(pabyBlock, kDoublesAt + kDoubleWidth * k, kDoubleWidth);
    }
    SetRecordDoubles(psRF, adfValues);
}

// Ten normalisation values and the constant and first-order adjustment
// terms; the second-order terms do not exist in this layout.
void ReadOlderNumericPart(const unsigned char* pabyBlock, RFInfo_t* psRF) {
    psRF->nExtra1 = ScanIntField(pabyBlock, kOldExtra1At, kOldIntWidth);
    psRF->nExtra2 = ScanIntField(pabyBlock, kOldExtra2At, kOldIntWidth);
    double adfValues[kRecordDoubles] = {};
    for (int k = 0; k < kOldNormalisationDoubles; ++k) {
        adfValues[k] = ScanField(pabyBlock, kOldDoublesAt + kDoubleWidth * k, kDoubleWidth);
    }
    for (int k = 0; k < kOldAdjustTerms; ++k) {
        const int nPixelSlot = kOldNormalisationDoubles + k;
        const int nLineSlot = kOldNormalisationDoubles + kOldAdjustTerms + k;
        adfValues[10 + k] =
            ScanField(pabyBlock, kOldDoublesAt + kDoubleWidth * nPixelSlot, kDoubleWidth);
        adfValues[16 + k] =
            ScanField(pabyBlock, kOldDoublesAt + kDoubleWidth * nLineSlot, kDoubleWidth);
    }
    SetRecordDoubles(psRF, adfValues);
}

// The adjustment is in force when a constant or first-order term is
// non-zero (a NaN counts as non-zero).
int AdjustmentInForce(const RFInfo_t* psRF) {
    for (int k = 0; k < kOldAdjustTerms; ++k) {
        if (psRF->adfPixelAdjust[k] != 0.0 || psRF->adfLineAdjust[k] != 0.0) return 1;
    }
    return 0;
}

void ReadCoefficients(const unsigned char* pabyBlock, int nOffset, int nTerms, double* padf) {
    for (int i = 0; i < nTerms; ++i)
        padf[i] = ScanField(pabyBlock, nOffset + kDoubleWidth * i, kDoubleWidth);
}

void ReadGeoreferencing(const unsigned char* pabyBlock, RFInfo_t* psRF) {
    CopyBounded(psRF->pszGeosys, FieldChars(pabyBlock, kGeosysAt, kTextChars));
    InitProjInfo(psRF->psProjInfo, 0);
    Geosys2ProjInfo(psRF->psProjInfo, psRF->pszGeosys, 0.0, 0.0, 1.0, 1.0);
    if (NeedsProjParms(psRF->pszGeosys)) {
        const std::string osParms = FieldChars(pabyBlock, kProjParmsAt, kProjParmsChars);
        ProjParms2Info(osParms.c_str(), psRF->psProjInfo);
    }
}

}  // namespace

unsigned char* LumoRFInfoToBinary(RFInfo_t* psRF, int* pnLength) {
    if (pnLength != nullptr) *pnLength = 0;
    if (psRF == nullptr || !HasCoefficientArrays(psRF)) {
        lumo::Warn(lumo::Err::kBadArgument,
                   _("Rational function model or its coefficient arrays are null."));
        return nullptr;
    }
    if (!CanBeWritten(psRF)) return nullptr;
    BlockPtr pabyBlock(static_cast<unsigned char*>(HMalloc(RF_BINARY_SIZE)));
    std::memset(pabyBlock.get(), ' ', RF_BINARY_SIZE);
    WriteHeader(psRF, pabyBlock.get());
    WriteNumericPart(psRF, pabyBlock.get());
    WriteCoefficients(psRF->padfPixelNum, psRF->nTerms, kPixelNumAt, pabyBlock.get());
    WriteCoefficients(psRF->padfPixelDen, psRF->nTerms, kPixelDenAt, pabyBlock.get());
    WriteCoefficients(psRF->padfLineNum, psRF->nTerms, kLineNumAt, pabyBlock.get());
    WriteCoefficients(psRF->padfLineDen, psRF->nTerms, kLineDenAt, pabyBlock.get());
    WriteGeoreferencing(psRF, pabyBlock.get());
    if (pnLength != nullptr) *pnLength = RF_BINARY_SIZE;
    return pabyBlock.release();
}

RFInfo_t* LumoBinaryToRFInfo(int nLength, unsigned char* pabyBlock) {
    // A shorter block than the layout would make every later field a read
    // past its end.
    if (pabyBlock == nullptr || (nLength > 0 && nLength < RF_BINARY_SIZE)) return nullptr;
    if (std::memcmp(pabyBlock, kMagic, kMagicLength) != 0) return nullptr;

    const bool bCurrentLayout = MarkerIs(pabyBlock, kLayoutMarkerAt, "2N");
    const int nTerms = bCurrentLayout ? ScanIntField(pabyBlock, kNumericAt, kTermsWidth)
                                      : ScanIntField(pabyBlock, kNumericAt, kOldIntWidth);
    // Each coefficient block has room for the model's 20 terms and no more.
    if (nTerms < 0 || nTerms > RF_MAX_TERMS) {
        lumo::WarnReal(lumo::Err::kBadArgument, "Rational function block nTerms", nTerms, 0);
        return nullptr;
    }

    RecordPtr psRF(RFAllocate(nullptr, nTerms), &RFDeallocate);
    psRF->nHalfPixelShift = ScanIntField(pabyBlock, kShiftFlagAt, 1);
    psRF->nDownsample = MarkerIs(pabyBlock, kDownsampleMarkerAt, "DS")
                            ? ScanIntField(pabyBlock, kDownsampleAt, kDownsampleWidth)
                            : 1;
    if (MarkerIs(pabyBlock, kSensorMarkerAt, "SENSOR")) {
        CopyBounded(psRF->pszSensor, FieldChars(pabyBlock, kSensorAt, kTextChars));
    }
    psRF->nTerms = nTerms;
    if (bCurrentLayout) {
        ReadCurrentNumericPart(pabyBlock, psRF.get());
    } else {
        ReadOlderNumericPart(pabyBlock, psRF.get());
    }
    psRF->nAdjust = AdjustmentInForce(psRF.get());
    ReadCoefficients(pabyBlock, kPixelNumAt, nTerms, psRF->padfPixelNum);
    ReadCoefficients(pabyBlock, kPixelDenAt, nTerms, psRF->padfPixelDen);
    ReadCoefficients(pabyBlock, kLineNumAt, nTerms, psRF->padfLineNum);
    ReadCoefficients(pabyBlock, kLineDenAt, nTerms, psRF->padfLineDen);
    ReadGeoreferencing(pabyBlock, psRF.get());
    // A block is read only into a model that can be evaluated.
    const std::string osProblem = RFValidate(psRF.get());
    if (!osProblem.empty()) {
        lumo::Warn(lumo::Err::kBadArgument, ("Rational function block: " + osProblem).c_str());
        return nullptr;
    }
    return psRF.release();
}
