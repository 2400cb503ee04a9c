// A table of any length: rows exist only near what is visible, in bodies of some dozens each. Bodies
// that are far away keep their height, so that the scroll bar stays honest.

const ROWS_OF_BODY = 40;
const PRINTED_ROWS = 2000; // more than anybody wants on paper

class LongTable {
  // columns: [{title, class}]; fillRow(id, row) adds the cells; fillDetails(id, cell) is called when a
  // row is unfolded, and is null for tables whose rows do not unfold.
  constructor(caption, columns, fillRow, fillDetails) {
    this.columns = columns;
    this.fillRow = fillRow;
    this.fillDetails = fillDetails;
    this.open = new Set();
    this.bodies = [];
    this.ids = [];
    this.rowHeight = 48;
    const head = make("tr", { role: "row" }, ...columns.map((column) =>
      make("th", { scope: "col", role: "columnheader", class: column.class }, column.title)));
    // The roles are those of the elements. They are written out because cards, as which phones show
    // the rows, would lose them.
    this.table = make("table", { class: "long", role: "table" }, make("caption", {}, caption),
      make("thead", { role: "rowgroup" }, head));
    this.limit = make("p", { class: "faint", hidden: true });
    this.element = make("div", {}, this.table, this.limit);
    this.observer = new IntersectionObserver((entries) => this.observed(entries), { rootMargin: "1200px 0px" });
  }

  show(ids) {
    this.observer.disconnect();
    for (const body of this.bodies) body.element.remove();
    this.ids = ids;
    this.bodies = [];
    this.table.setAttribute("aria-rowcount", String(ids.length + 1));
    const all = document.createDocumentFragment();
    for (let first = 0; first < ids.length; first += ROWS_OF_BODY) {
      const element = make("tbody", { role: "rowgroup" });
      const body = { element, first, height: 0, filled: false };
      element.body = body;
      this.bodies.push(body);
      this.empty(body);
      all.append(element);
    }
    this.table.append(all);
    if (this.bodies.length > 0) this.fill(this.bodies[0]); // so that its height is a measure for the others
    for (const body of this.bodies) this.observer.observe(body.element);
  }

  rowsOf(body) {
    return Math.min(ROWS_OF_BODY, this.ids.length - body.first);
  }

  empty(body) {
    const gap = make("td", { colspan: this.columns.length, class: "gap" });
    gap.style.height = `${body.height || this.rowsOf(body) * this.rowHeight}px`;
    body.element.replaceChildren(make("tr", { "aria-hidden": "true" }, gap));
    body.filled = false;
  }

  fill(body) {
    if (body.filled) return;
    const rows = document.createDocumentFragment();
    for (let i = 0; i < this.rowsOf(body); ++i) {
      const id = this.ids[body.first + i];
      const row = make("tr", { role: "row", "aria-rowindex": body.first + i + 2, "data-id": id });
      this.fillRow(id, row);
      rows.append(row);
      if (this.open.has(id)) rows.append(this.unfolded(row, id));
    }
    body.element.replaceChildren(rows);
    body.filled = true;
  }

  observed(entries) {
    for (const entry of entries) {
      const body = entry.target.body;
      if (entry.isIntersecting) {
        this.fill(body);
      } else if (body.filled && !body.element.contains(document.activeElement)) {
        // A hidden panel has no height that would be worth keeping.
        const height = body.element.getBoundingClientRect().height;
        if (height === 0) continue;
        body.height = height;
        this.empty(body);
      }
    }
    this.measure();
  }

  // What a row takes on this screen, for the bodies that were never filled.
  measure() {
    const first = this.bodies[0];
    if (!first || !first.filled || this.open.size > 0) return;
    const height = first.element.getBoundingClientRect().height / this.rowsOf(first);
    if (height === 0 || Math.abs(height - this.rowHeight) < 1) return;
    this.rowHeight = height;
    for (const body of this.bodies) if (!body.filled && !body.height) this.empty(body);
  }

  // After a change of width, former heights mean nothing.
  resized() {
    for (const body of this.bodies) body.height = 0;
    this.measure();
  }

  unfolded(row, id) {
    const cell = make("td", { colspan: this.columns.length, role: "cell" });
    this.fillDetails(id, cell);
    const details = make("tr", { class: "details", role: "row", id: `${this.prefix}-${id}` }, cell);
    const button = row.querySelector("button");
    button.setAttribute("aria-expanded", "true");
    button.setAttribute("aria-controls", details.id);
    return details;
  }

  toggle(row) {
    const id = Number(row.dataset.id);
    if (this.open.delete(id)) {
      row.nextElementSibling.remove();
      const button = row.querySelector("button");
      button.setAttribute("aria-expanded", "false");
      button.removeAttribute("aria-controls");
    } else {
      this.open.add(id);
      row.after(this.unfolded(row, id));
    }
    row.parentElement.body.height = 0;
  }

  // Paper cannot be scrolled: everything up to the limit is there.
  preparePrint() {
    const last = Math.min(this.ids.length, PRINTED_ROWS);
    for (const body of this.bodies) {
      if (body.first < last) this.fill(body);
      else body.element.hidden = true;
    }
    this.limit.hidden = this.ids.length <= last;
    this.limit.textContent = `Printed: the first ${last.toLocaleString("en-US")} of ` +
      `${counted(this.ids.length, "key")}. A search selects others.`;
  }

  afterPrint() {
    for (const body of this.bodies) body.element.hidden = false;
    this.limit.hidden = true;
  }
}
