#include "model/MemoryDataLayer.h"

#include <cstdint>
#include <string>

#include "model/DefinitionNumbers.h"

namespace vora {
namespace netdef {

using prototext::Field;
using prototext::Message;

bool IsMemoryData(const Message& layer) {
    const std::string type = layer.Scalar("type");
    return type == "MemoryData" || type == "MEMORY_DATA" || type == "29";  // the last two: old layer format
}

// Fills the transform from the layer and returns the replacement fields.
std::vector<Field> ReplaceMemoryData(const Message& layer, PreparedDefinition& prepared) {
    const std::string context = "MemoryData layer '" + layer.Scalar("name") + "'";
    const std::vector<std::string> tops = layer.Scalars("top");
    if (tops.empty()) Refuse(context + " has no top");

    const Field* params = layer.First("memory_data_param");
    if (params == nullptr || !params->isMessage) Refuse(context + " has no memory_data_param");
    InputTransform& transform = prepared.transform;
    transform.channels = PositiveInt(params->message, "channels", "memory_data_param");
    transform.height = PositiveInt(params->message, "height", "memory_data_param");
    transform.width = PositiveInt(params->message, "width", "memory_data_param");

    const Field* transformField = layer.First("transform_param");
    if (transformField != nullptr && transformField->isMessage) {
        const Message& t = transformField->message;
        const Field* crop = t.First("crop_size");
        if (crop != nullptr) {
            const int64_t size = ParseInteger(crop->value, "crop_size");
            if (size < 0 || size > transform.height || size > transform.width)
                Refuse("crop_size " + crop->value + " does not fit the " + std::to_string(transform.height) + " x " +
                       std::to_string(transform.width) + " input");
            transform.cropSize = static_cast<int>(size);
        }
        const Field* scale = t.First("scale");
        if (scale != nullptr) transform.scale = ParseFloat(scale->value, "scale");
        for (const std::string& mean : t.Scalars("mean_value")) transform.meanValues.push_back(ParseFloat(mean, "mean_value"));
        const size_t means = transform.meanValues.size();
        if (means > 1 && means != static_cast<size_t>(transform.channels))
            Refuse(std::to_string(means) + " mean_value entries for " + std::to_string(transform.channels) +
                   " channels (give one, or one per channel)");
        prepared.meanFile = t.Scalar("mean_file");
        if (!prepared.meanFile.empty() && means > 0) Refuse("mean_file and mean_value cannot both be given");
        // mirror only matters while training; it is ignored here.
    }

    prepared.memoryData = true;
    prepared.inputName = tops[0];  // the label top is dropped

    Message shape;
    const int dims[4] = {1, transform.channels, transform.OutputHeight(), transform.OutputWidth()};
    for (int dim : dims) shape.fields.push_back(Field::MakeScalar("dim", std::to_string(dim), false));
    return {Field::MakeScalar("input", tops[0], true), Field::MakeMessage("input_shape", shape)};
}

}  // namespace netdef
}  // namespace vora
