// What all commands have in common that list one thing after the other: as JSON, an
// element each, or as a table.
//
// The list begins once the first element is there or reading has ended, so that a store
// that cannot be read leaves no half of a list behind.
#pragma once

#include <functional>
#include <string_view>
#include <utility>
#include <vector>

#include "Context.h"
#include "output/JsonStream.h"
#include "output/Table.h"

namespace halyard::ctl {

// Calls back with each; false: enough.
template <class T>
using ForEach = std::function<Outcome<void>(Context&, const std::function<bool(const T&)>&)>;

template <class T>
Exit listAsJson(Context& context, const ForEach<T>& forEach,
                const std::function<void(JsonStream&, const T&)>& write) {
    JsonStream json(context.terminal.stream());
    bool begun = false;
    const auto begin = [&] {
        if (!std::exchange(begun, true)) {
            json.beginList();
        }
    };
    const Outcome<void> read = forEach(context, [&](const T& one) {
        begin();
        write(json, one);
        return context.terminal.goesOn();
    });
    if (read.ok()) {
        begin();
    }
    if (begun) {
        json.endList();
    }
    return finish(context, read);
}

template <class T>
Exit listAsTable(Context& context, const ForEach<T>& forEach,
                 const std::vector<Table::Column>& columns,
                 const std::function<std::vector<Cell>(const T&)>& cellsOf, std::string_view none) {
    context.terminal.page();
    Table table(context.terminal, columns);
    bool any = false;
    const Outcome<void> read = forEach(context, [&](const T& one) {
        any = true;
        return table.add(cellsOf(one));
    });
    if (read.ok() || any) {
        table.finish(none);
    }
    return finish(context, read);
}

} // namespace halyard::ctl
