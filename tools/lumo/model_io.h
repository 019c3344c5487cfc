// Model files: a JSON envelope common to every family ("format", "version",
// "family", "geosys", "projParms", "pixels", "lines") and one section named
// after the family that holds its coefficients. The family field selects the
// reader; each family registers a codec in ModelFamilies().
#pragma once

#include <memory>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "lumo.h"
#include "poly_fit.h"

namespace lumo::cli {

constexpr const char* kModelFormat = "lumo-model";
constexpr int kModelFormatVersion = 1;

struct PolyDeleter {
    void operator()(POLYInfo_t* psPoly) const noexcept { POLYDeallocate(psPoly); }
};
using PolyPtr = std::unique_ptr<POLYInfo_t, PolyDeleter>;

// The fields every model file carries, checked and decoded.
struct ModelEnvelope {
    std::string osSource;     // file name used in messages
    std::string osFamily;     // "poly", ...
    std::string osGeosys;     // georeferencing text of the ground coordinates
    std::string osProjParms;  // parameter text of the projection; empty when not needed
    int nPixels = 0;
    int nLines = 0;
};

// A model read from a file: its family record, released by the family's own
// release function when the last copy goes.
struct LoadedModel {
    ModelEnvelope sEnvelope;
    int nModelCode = LUMO_CODE_NONE;
    std::shared_ptr<void> poRecord;

    // A polynomial model's fit as the regression made it, when the file keeps
    // it; evaluated instead of the record's raw coefficients.
    std::shared_ptr<const PolyFit> poPolyFit;

    // The record as a polynomial model; null for other families.
    POLYInfo_t* AsPoly() const;
    // The model both ways (the generic dispatch, or the kept fit); 1 on
    // success, 0 when the model cannot map the point.
    int GroundToImage(double x, double y, double z, double* pixel, double* line) const;
    int ImageToGround(double pixel, double line, double z, double* x, double* y) const;
};

// Reader of one family's section.
struct ModelFamilyCodec {
    const char* pszFamily;  // value of "family" and name of the family's section
    int nModelCode;
    const char* pszDescription;
    std::shared_ptr<void> (*pfnRead)(const ModelEnvelope& envelope, const nlohmann::json& section);
};

// Every family the model-file reader knows.
const std::vector<ModelFamilyCodec>& ModelFamilies();

// Readers. Every failure throws nova::DataException with a message that names
// the file and the field (or the JSON position).
LoadedModel ReadModel(const nlohmann::json& document, const std::string& source);
LoadedModel ReadModelFile(const std::string& path);
// A model file that must hold the family `pszFamily` ("poly", ...); another
// family is refused before its section is read.
LoadedModel ReadModelFileOf(const std::string& path, const char* pszFamily);
nlohmann::json ParseJsonFile(const std::string& path);

// The polynomial family; the writer keeps the fit beside the record when
// given.
PolyPtr PolyFromJson(const ModelEnvelope& envelope, const nlohmann::json& section);
nlohmann::json PolyToJson(const POLYInfo_t& poly, const PolyFit* psFit = nullptr);
PolyPtr ReadPolyModelFile(const std::string& path);
// Hands a polynomial record to the type-erased owner of LoadedModel.
std::shared_ptr<void> SharePolyRecord(PolyPtr poly);

// The envelope of a model whose ground coordinates are described by
// `psProjInfo` (the parameter text is written only when the projection needs
// it); the family's section is added by the caller.
nlohmann::json MakeEnvelope(const char* pszFamily, const char* pszGeosys,
                            const ProjInfo_t* psProjInfo, int nPixels, int nLines);

// Refuses a model whose record the family's validation found unusable
// (`problem` names the record field and value; empty: nothing to refuse).
void RequireValidRecord(const ModelEnvelope& envelope, const char* pszFamily,
                        const std::string& problem);

// Fills a projection description from the envelope's georeferencing text and
// parameter text.
void EnvelopeToProjInfo(const ModelEnvelope& envelope, ProjInfo_t* psProjInfo);

// Writes text to a file through a temporary file in the same directory, so an
// existing file is replaced only once the new contents are complete.
void WriteFileReplacing(const std::string& path, const std::string& contents);
void WriteModelFile(const std::string& path, const nlohmann::json& document);

}  // namespace lumo::cli
