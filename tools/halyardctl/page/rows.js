// Rows of the tables. The large ones lie packed in the page and are unpacked, a chunk
// after the other, when they are needed: the newest first.

async function unpack(text) {
  const bytes = Uint8Array.from(atob(text), (c) => c.charCodeAt(0));
  const stream = new Blob([bytes]).stream().pipeThrough(new DecompressionStream("deflate"));
  return (await new Response(stream).text()).trimEnd().split("\n");
}

class PackedRows {
  constructor({ total, chunks }) {
    this.total = total;
    this.kept = d3.sum(chunks, ([rows]) => rows);
    this.chunks = [...chunks].reverse();
    this.lines = []; // of the chunks so far, newest first
    this.unpacked = 0;
  }
  // Whether there are so many; unpacks until there are.
  async upTo(count) {
    while (this.lines.length < count && this.unpacked < this.chunks.length) {
      const lines = await unpack(this.chunks[this.unpacked++][1]);
      for (let i = lines.length - 1; i >= 0; --i) this.lines.push(lines[i]);
    }
  }
  // Numbers of the lines that hold all words.
  async find(words) {
    await this.upTo(Infinity);
    const found = [];
    this.lines.forEach((line, index) => {
      const text = line.toLowerCase();
      if (words.every((word) => text.includes(word))) found.push(index);
    });
    return found;
  }
  async row(index) {
    await this.upTo(index + 1);
    return JSON.parse(this.lines[index]);
  }
}

// Rows that the digest has as they are.
class PlainRows {
  constructor(rows, gone) {
    this.rows = [...rows].reverse();
    this.kept = rows.length;
    this.total = rows.length + gone;
  }
  async find(words) {
    const found = [];
    this.rows.forEach((row, index) => {
      const text = JSON.stringify(row).toLowerCase();
      if (words.every((word) => text.includes(word))) found.push(index);
    });
    return found;
  }
  async row(index) {
    return this.rows[index];
  }
}
