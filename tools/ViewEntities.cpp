#include <stdio.h>

#include <string>
#include <vector>

#include "IpmiEntity.h"
#include "IpmiIfc.h"
#include "Views.h"

namespace {

bool sameEntity(const Ipmi::IpmiEntity& a, const Ipmi::IpmiEntity& b) {
    return a.id == b.id && a.instance == b.instance;
}

std::string entityKey(const Ipmi::IpmiEntity& e) { return std::to_string(e.id) + "." + std::to_string(e.instance); }

// The entity list is the tree in pre-order: each container followed by what
// it contains. The parent query alone cannot tell a container's own place from
// the places where another container lists it, so each container is placed
// where its contained entities follow it (or, without any, where it first
// appears); every other entry is placed under the container before it.
std::vector<bool> containerPlaces(const std::vector<Ipmi::IpmiEntity>& all,
                                  const std::vector<Ipmi::IpmiEntity>& parents) {
    const Ipmi::IpmiEntity none;
    std::vector<bool> place(all.size(), false);
    std::vector<Ipmi::IpmiEntity> placed;
    for (size_t i = 0; i < all.size(); ++i) {
        if (!(parents[i] == none)) continue;
        bool done = false;
        for (const auto& p : placed) done = done || sameEntity(p, all[i]);
        if (done) continue;
        size_t chosen = i;
        for (size_t j = i; j + 1 < all.size(); ++j) {
            if (sameEntity(all[j], all[i]) && sameEntity(parents[j + 1], all[i])) {
                chosen = j;
                break;
            }
        }
        place[chosen] = true;
        placed.push_back(all[i]);
    }
    return place;
}

int entities(std::vector<Tool::Section>& out) {
    // Without a polling loop nothing has read the repository yet: run the
    // refresh chain once, which builds the sensors and the entity tree.
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) fprintf(stderr, "tavipmi: could not read the SDR repository\n");
    const std::vector<Ipmi::IpmiEntity> all = Ipmi::IpmiIfc::getEntities(0);
    std::vector<Ipmi::IpmiEntity> parents;
    for (const auto& e : all) parents.push_back(Ipmi::IpmiIfc::getEntityParent(0, e.id, e.instance));
    const std::vector<bool> isContainer = containerPlaces(all, parents);

    Tool::Section s;
    s.name = "entities";
    s.title = "Entities";
    // The table shows the tree by indentation; data formats name the container.
    s.columns = {{"tree", "Entity", Tool::Column::TableOnly},
                 {"entity", "Entity", Tool::Column::DataOnly},
                 {"name", "Name", Tool::Column::DataOnly},
                 {"container", "Container", Tool::Column::DataOnly}};
    std::string container;
    for (size_t i = 0; i < all.size(); ++i) {
        Tool::Json r;
        const std::string label = all[i].getName() + " (" + entityKey(all[i]) + ")";
        r["tree"] = isContainer[i] ? label : "  " + label;
        r["entity"] = entityKey(all[i]);
        r["name"] = all[i].getName();
        if (isContainer[i])
            container = entityKey(all[i]);
        else if (!container.empty())
            r["container"] = container;
        s.records.push_back(std::move(r));
    }
    out.push_back(std::move(s));
    return 0;
}

Tool::ViewRegistrar reg("entities", Tool::View{"entity containment tree", nullptr, entities, 40, true});

}  // namespace
