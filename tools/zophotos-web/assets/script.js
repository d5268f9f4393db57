// The one script of all pages. It reads these members of the JSON interface. Identifiers of photos
// and folders are decimal texts, because they can be larger than JavaScript's exact numbers.
//
//   PHOTO   {"id": "7516192769", "name": "a.jpg", "path": "/shares/Photos/a.jpg", "folder": "2",
//            "volume": "/shares/Photos/", "modified": "2026-11-21T08:15:00Z" or null,
//            "local_time": "2026-11-21 09:15:00"}
//   FOLDER  {"id": "2", "parent": "1" or null, "name": "Sea", "path": "/shares/Photos/Sea/",
//            "volume": "/shares/Photos/", "has_folders": true, "has_photos": true}
//   VOLUME  {"volume": "/shares/Photos/", "merged": true, "gone": false, "transcoded": 1, "total": 2,
//            "merged_up_to": "2026-11-21T08:15:00Z" or null, "local_merged_up_to": text or null,
//            "state": text or null, "folders_waiting": 0 or null, "waiting": 0 or null,
//            "failed": 0 or null, "rendering": false, "activity": "being indexed" or ""}
//
//   /api/photos?before=ID or after=ID&count=100&words=&volume=&folder=&month=
//                               {"photos": [PHOTO, ...], newest first, "more": true}: there are more
//                               in that direction
//   /api/photos/ID?words=&...   PHOTO with "newer": "ID" or null, "older": "ID" or null
//   /api/folders?parent=ID&after=ID&count=100    {"folders": [FOLDER, ...], "more": true}
//   /api/volumes                {"volumes": [VOLUME, ...], "more": false}
//   /api/status                 {"state": "no_database", "building", "current" or "failed",
//                               "done": 0, "total": 0, "reason": text, "version": 1}
//   /api/events                 "event: change" with the version as its data, first and after each
//                               change of the photos; "event: volumes" when the work of the services
//                               has changed

const COUNT = 100; // photos of a request
const MOST = 600; // photos in a grid at a time: those far away are removed and fetched again
const NEAR = 1500; // pixels from an end of the grid at which more photos are fetched
const CALM = 500; // milliseconds between two updates
const RETRY = 30000; // milliseconds until the next try when the server has too many clients
const FIRST_PAUSE = 5000; // milliseconds after an update that failed; doubled after each further one
const LONGEST_PAUSE = 60000;
const MOST_IN_STRIP = 24; // volumes above the newest photos
const MONTHS = ["January", "February", "March", "April", "May", "June", "July", "August",
  "September", "October", "November", "December"];

async function fetchJson(address, options) {
  const response = await fetch(address, options);
  if (!response.ok) {
    throw new Error(`${address}: ${response.status}`, { cause: response.status });
  }
  return response.json();
}

// A name for people: characters that are invisible or control the text are shown as escapes of
// their bytes. The server does the same.
function shown(name) {
  return name.replace(/[\\\p{Cc}\p{Cs}\p{Zl}\p{Zp}\p{DI}]/gu, (character) => {
    if (/[\p{Join_Control}\p{Variation_Selector}]/u.test(character)) {
      return character;
    }
    if (character === "\\") {
      return "\\\\";
    }
    return [...new TextEncoder().encode(character)]
      .map((byte) => `\\x${byte.toString(16).padStart(2, "0")}`)
      .join("");
  });
}

// "/shares/Photos/" -> "Photos"
function lastComponent(path) {
  return path.replace(/\/+$/, "").split("/").pop() || path;
}

function monthOf(photo) {
  return /^\d{4}-\d{2}-\d{2} /.test(photo.local_time) ? photo.local_time.slice(0, 7) : "";
}

function monthTitle(month) {
  return month === "" ? "Other times" : `${MONTHS[Number(month.slice(5)) - 1]} ${month.slice(0, 4)}`;
}

function grouped(number) {
  return number.toLocaleString("en");
}

function cloneOf(template) {
  return document.getElementById(template).content.firstElementChild.cloneNode(true);
}

// `query` is "" or "?words=...".
function withQuery(address, query) {
  return address.includes("?") ? address + query.replace("?", "&") : address + query;
}

function photoAddress(id, query) {
  return withQuery(`/photos/${id}`, query);
}

// JSON has only UTF-8: the server's own links also work for other names.
function volumeAddress(volume) {
  return `/search?volume=${encodeURIComponent(volume)}`;
}

function isNewer(a, b) {
  return BigInt(a) > BigInt(b);
}

function makeTile(photo, query) {
  const tile = cloneOf("tile");
  tile.dataset.id = photo.id;
  tile.querySelector("a").href = photoAddress(photo.id, query);
  const image = tile.querySelector("img");
  image.alt = shown(photo.name);
  image.src = `/photos/${photo.id}/rendition`;
  tile.querySelector("bdi").textContent = shown(photo.name);
  return tile;
}

// The photos of a view, newest first. Shows a part of the list, which grows where the user scrolls
// to and is cut off at the other end.
class Grid {
  constructor(root) {
    this.root = root;
    this.query = root.dataset.query;
    this.hasNewer = "newer" in root.dataset;
    this.hasOlder = "older" in root.dataset;
    this.links = root.nextElementSibling;
    this.links.hidden = true;
    this.photos = [...root.querySelectorAll("li[data-id]")].map((tile) => ({
      id: tile.dataset.id,
      month: tile.closest("section").dataset.month,
      tile,
    }));
    this.working = Promise.resolve();
    this.onFailure = () => {};
    this.makeNews();
    let isWaiting = false;
    const look = () => {
      if (!isWaiting) {
        isWaiting = true;
        requestAnimationFrame(() => {
          isWaiting = false;
          this.look();
        });
      }
    };
    addEventListener("scroll", look, { passive: true });
    addEventListener("resize", look, { passive: true });
    root.addEventListener("keydown", (event) => this.moveFocus(event));
    look();
  }

  // The button that tells of photos that are not shown yet.
  makeNews() {
    this.news = document.createElement("button");
    this.news.type = "button";
    this.news.className = "news";
    this.news.hidden = true;
    this.news.addEventListener("click", () => this.showNewest());
    const region = document.createElement("div");
    region.setAttribute("role", "status");
    region.append(this.news);
    this.root.before(region);
  }

  // Runs one change at a time. Returns whether it succeeded.
  run(change) {
    this.working = this.working.then(change).then(() => {
      this.links.hidden = true;
      return true;
    }, () => {
      this.showLinks();
      this.onFailure();
      return false;
    });
    return this.working;
  }

  // The links to more photos, for when the script cannot get them.
  showLinks() {
    const link = this.links.querySelector(".older");
    if (link !== null && this.photos.length > 0) {
      const address = new URL(link.href);
      address.searchParams.set("before", this.photos.at(-1).id);
      link.href = address;
    }
    this.links.hidden = false;
  }

  // Fetches photos where the user is close to an end. Returns whether it succeeded.
  async look() {
    if (this.isLooking) {
      return true;
    }
    const box = this.root.getBoundingClientRect();
    const needsOlder = this.hasOlder && box.bottom < innerHeight + NEAR;
    const needsNewer = this.hasNewer && box.top > -NEAR;
    if (needsOlder || needsNewer) {
      this.isLooking = true;
      const hasSucceeded = await this.run(() => this.photos.length === 0 ? this.compare()
        : needsOlder ? this.addOlder() : this.addNewer());
      this.isLooking = false;
      return hasSucceeded && this.look();
    }
    if (!this.news.hidden && !this.hasNewer && this.isAtTop()) {
      return this.run(() => this.compare());
    }
    return true;
  }

  isAtTop() {
    return scrollY < 100;
  }

  async fetchPhotos(parameters) {
    const answer = await fetchJson(withQuery(`/api/photos?count=${COUNT}${parameters}`, this.query));
    const known = new Map(this.photos.map((photo) => [photo.id, photo]));
    const photos = answer.photos.map((photo) => known.get(photo.id) ??
      { id: photo.id, month: monthOf(photo), tile: makeTile(photo, this.query) });
    for (const photo of photos) {
      photo.tile.classList.remove("gone");
    }
    return { photos, more: answer.more };
  }

  async addOlder() {
    const { photos, more } = await this.fetchPhotos(`&before=${this.photos.at(-1).id}`);
    this.hasOlder = more;
    let all = [...this.photos, ...photos];
    const first = this.firstToKeep(all, all.length - MOST);
    if (first > 0) {
      this.hasNewer = true;
      all = all.slice(first);
    }
    this.show(all);
  }

  async addNewer() {
    const { photos, more } = await this.fetchPhotos(`&after=${this.photos[0].id}`);
    this.hasNewer = more;
    // Adds whole rows, so that the photos below stay in their columns.
    const isOneMonth = photos.every((photo) => photo.month === this.photos[0].month);
    const surplus = more && isOneMonth ? photos.length % this.columns() : 0;
    const all = [...photos.slice(surplus), ...this.photos];
    if (all.length > MOST) {
      this.hasOlder = true;
    }
    this.show(all.slice(0, MOST));
  }

  // The first of `photos` to keep when up to `excess` of them are to go, so that the others of its
  // month stay in their columns.
  firstToKeep(photos, excess) {
    if (excess <= 0) {
      return 0;
    }
    const columns = this.columns();
    const start = photos.findIndex((photo) => photo.month === photos[excess].month);
    return start + Math.floor((excess - start) / columns) * columns;
  }

  columns() {
    const grid = this.root.querySelector("ol");
    return grid === null ? 1 : getComputedStyle(grid).gridTemplateColumns.split(" ").length;
  }

  // Shows these photos. What the user looks at keeps its place on the screen if `keepsPlace`.
  show(photos, keepsPlace = true) {
    const kept = new Set(photos.map((photo) => photo.id));
    const anchor = this.photos.find((photo) => keepsPlace && kept.has(photo.id) &&
      photo.tile.getBoundingClientRect().bottom > 0);
    const top = anchor?.tile.getBoundingClientRect().top;
    const focused = document.activeElement;
    for (const photo of this.photos) {
      if (!kept.has(photo.id)) {
        photo.tile.remove();
      }
    }
    this.photos = photos;
    this.arrange();
    document.querySelector(".nothing")?.toggleAttribute("hidden", photos.length > 0);
    if (focused !== document.activeElement && focused.isConnected) {
      focused.focus({ preventScroll: true });
    }
    if (anchor !== undefined) {
      scrollBy({ top: anchor.tile.getBoundingClientRect().top - top, behavior: "instant" });
    }
  }

  // Makes the elements of the photos, month by month, and leaves those that are there as they are.
  arrange() {
    let section = null;
    let grid = null;
    let next = this.root.firstElementChild;
    let nextTile = null;
    const finish = () => {
      while (nextTile !== null) {
        const tile = nextTile;
        nextTile = tile.nextElementSibling;
        tile.remove();
      }
    };
    for (const photo of this.photos) {
      if (section === null || section.dataset.month !== photo.month) {
        finish();
        section = next;
        while (section !== null && section.dataset.month !== photo.month &&
               !this.photos.some((other) => other.month === section.dataset.month)) {
          next = section.nextElementSibling;
          section.remove();
          section = next;
        }
        if (section?.dataset.month === photo.month) {
          next = section.nextElementSibling;
        } else {
          section = this.makeSection(photo.month);
          this.root.insertBefore(section, next);
        }
        grid = section.querySelector("ol");
        nextTile = grid.firstElementChild;
      }
      if (photo.tile === nextTile) {
        nextTile = nextTile.nextElementSibling;
      } else {
        grid.insertBefore(photo.tile, nextTile);
      }
    }
    finish();
    while (next !== null) {
      section = next;
      next = section.nextElementSibling;
      section.remove();
    }
  }

  makeSection(month) {
    const section = document.createElement("section");
    section.className = "month";
    section.dataset.month = month;
    const heading = document.createElement("h2");
    heading.textContent = monthTitle(month);
    const grid = document.createElement("ol");
    grid.className = "grid";
    section.append(heading, grid);
    return section;
  }

  // Follows a change of the list. What is above the lower end of the window stays as it is while the
  // user looks at it: new photos there are only told of, and photos that have left are greyed.
  async compare() {
    const isEmpty = this.photos.length === 0;
    const isFree = isEmpty || (this.isAtTop() && !this.hasNewer);
    const last = this.photos.at(-1)?.id;
    let parameters = this.hasNewer && !isEmpty ? `&before=${BigInt(this.photos[0].id) + 1n}` : "";
    let all = [];
    let isMore = true;
    while (isMore && all.length < MOST && (all.length === 0 || !this.hasOlder ||
           (!isEmpty && isNewer(all.at(-1).id, last)))) {
      const { photos, more } = await this.fetchPhotos(parameters);
      all.push(...photos);
      isMore = more && photos.length > 0;
      parameters = `&before=${all.at(-1)?.id}`;
    }
    if (isFree) {
      this.tell(0, false);
      this.hasNewer = false;
      this.hasOlder = isMore;
      this.show(all, false);
      return;
    }
    const seen = this.photos.filter((photo) => photo.tile.getBoundingClientRect().top < innerHeight);
    const edge = seen.at(-1);
    const current = new Set(all.map((photo) => photo.id));
    const before = new Set(seen.map((photo) => photo.id));
    const isWhole = !isMore || !isNewer(all.at(-1).id, edge.id);
    for (const photo of seen) {
      const isKnown = isWhole || isNewer(photo.id, all.at(-1).id);
      if (isKnown && !current.has(photo.id)) {
        photo.tile.classList.add("gone");
      }
    }
    const added = all.filter((photo) => isNewer(photo.id, edge.id) && !before.has(photo.id));
    this.tell(added.length, !isWhole || seen.some((photo) => photo.tile.matches(".gone")));
    if (isWhole) {
      this.hasOlder = isMore;
      this.show([...seen, ...all.filter((photo) => isNewer(edge.id, photo.id))]);
    }
  }

  tell(count, hasMore) {
    this.news.hidden = count === 0 && !hasMore;
    this.news.textContent = count === 0 ? "Show the changes"
      : count === 1 ? "1 new photo" : `${grouped(count)} new photos`;
  }

  showNewest() {
    return this.run(async () => {
      const { photos, more } = await this.fetchPhotos("");
      this.hasNewer = false;
      this.hasOlder = more;
      this.tell(0, false);
      this.show(photos, false);
      scrollTo({ top: 0 });
      this.photos[0]?.tile.querySelector("a").focus({ preventScroll: true });
      this.look();
    });
  }

  // Returns whether it succeeded.
  async refresh() {
    return await this.run(() => this.compare()) && this.look();
  }

  // Arrow keys move the focus from photo to photo.
  moveFocus(event) {
    const tile = event.target.closest("li[data-id]");
    const at = this.photos.findIndex((photo) => photo.tile === tile);
    if (at < 0 || event.ctrlKey || event.altKey || event.metaKey || event.shiftKey) {
      return;
    }
    const box = tile.getBoundingClientRect();
    const isInColumn = (photo) => Math.abs(photo.tile.getBoundingClientRect().left - box.left) < 2;
    const target = {
      ArrowLeft: () => this.photos[at - 1],
      ArrowRight: () => this.photos[at + 1],
      ArrowUp: () => this.photos.slice(0, at).findLast(isInColumn),
      ArrowDown: () => this.photos.slice(at + 1).find(isInColumn),
    }[event.key]?.();
    if (target !== undefined) {
      event.preventDefault();
      target.tile.querySelector("a").focus();
    }
  }

  // After the viewer: the photo that it showed last has the focus.
  focus(id) {
    this.photos.find((photo) => photo.id === id)?.tile.querySelector("a").focus();
  }
}

// One photo, large: on its own page, or in a dialog above a list.
class Viewer {
  constructor(article, query) {
    this.article = article;
    this.query = query;
    this.image = article.querySelector("img.large");
    this.id = null;
    this.onFailure = () => {};
    this.image.addEventListener("error", () => this.setMissing(true));
    this.image.addEventListener("load", () => this.setMissing(false));
    for (const direction of ["newer", "older"]) {
      this.link(direction).addEventListener("click", (event) => {
        if (!isPlainClick(event)) {
          return;
        }
        event.preventDefault();
        this.step(direction);
      });
    }
    this.followSwipes();
  }

  link(direction) {
    return this.article.querySelector(`a.step.${direction}`);
  }

  setMissing(isMissing) {
    this.image.hidden = isMissing;
    this.article.querySelector(".missing").hidden = !isMissing;
  }

  // Takes the photo that the server has put on the page.
  take(id) {
    this.id = id;
    if (this.image.complete && this.image.naturalWidth === 0) {
      this.setMissing(true);
    }
    this.prefetch();
  }

  async show(id) {
    this.id = id;
    const photo = await this.fetchPhoto(id).catch(() => null);
    if (this.id !== id) {
      return;
    }
    if (photo === null) {
      this.setMissing(true);
      this.onFailure();
      return;
    }
    this.fill(photo);
    this.setNeighbours(photo);
  }

  // Follows a change of the list. The photo stays on the screen, even if it has left.
  async refresh() {
    const id = this.id;
    if (id === null) {
      return;
    }
    const photo = await this.fetchPhoto(id);
    if (this.id === id) {
      if (this.image.hidden) {
        this.fill(photo);
      }
      this.setNeighbours(photo);
    }
  }

  // The photo with its neighbours; only the neighbours if the photo has left.
  async fetchPhoto(id) {
    try {
      return await fetchJson(withQuery(`/api/photos/${id}`, this.query));
    } catch (error) {
      if (error.cause !== 404) {
        throw error;
      }
      const neighbour = async (direction) => {
        const address = withQuery(`/api/photos?count=1&${direction}=${id}`, this.query);
        return (await fetchJson(address)).photos[0]?.id ?? null;
      };
      return { newer: await neighbour("after"), older: await neighbour("before") };
    }
  }

  fill(photo) {
    const isThere = "id" in photo;
    const name = isThere ? shown(photo.name) : "No longer there";
    this.article.querySelector("h1 bdi").textContent = name;
    document.title = name;
    for (const selector of ["dl", ".original"]) {
      this.article.querySelector(selector).hidden = !isThere;
    }
    this.setMissing(!isThere);
    if (!isThere) {
      return;
    }
    this.image.alt = name;
    this.image.src = `/photos/${photo.id}/rendition`;
    const time = this.article.querySelector("time");
    time.textContent = photo.local_time;
    if (photo.modified === null) {
      time.removeAttribute("datetime");
    } else {
      time.dateTime = photo.modified;
    }
    const setLink = (selector, address, text) => {
      const link = this.article.querySelector(selector);
      link.href = address;
      link.querySelector("bdi").textContent = shown(text);
    };
    setLink(".volume-link", volumeAddress(photo.volume), photo.volume);
    setLink(".folder-link", `/folders/${photo.folder}`,
      photo.path.slice(0, photo.path.lastIndexOf("/") + 1));
    this.article.querySelector(".original").href = `/photos/${photo.id}/original`;
  }

  setNeighbours(photo) {
    for (const direction of ["newer", "older"]) {
      const link = this.link(direction);
      const isFocused = document.activeElement === link;
      link.hidden = photo[direction] === null;
      link.href = link.hidden ? "" : photoAddress(photo[direction], this.query);
      if (isFocused && link.hidden) {
        this.article.querySelector(".close").focus();
      }
    }
    this.prefetch();
  }

  prefetch() {
    for (const direction of ["older", "newer"]) {
      if (!this.link(direction).hidden) {
        new Image().src = `${this.link(direction).pathname}/rendition`;
      }
    }
  }

  step(direction) {
    const link = this.link(direction);
    if (!link.hidden) {
      history.replaceState(history.state, "", link.href);
      this.show(photoOfLocation());
    }
  }

  // Returns whether the key was one of the viewer's.
  press(event) {
    const direction = { ArrowLeft: "newer", ArrowRight: "older" }[event.key];
    if (direction === undefined || event.ctrlKey || event.altKey || event.metaKey ||
        event.shiftKey || event.target.matches("input, select")) {
      return false;
    }
    event.preventDefault();
    this.step(direction);
    return true;
  }

  followSwipes() {
    let start = null;
    this.article.addEventListener("touchstart", (event) => {
      start = event.touches.length === 1 ? event.touches[0] : null;
    }, { passive: true });
    this.article.addEventListener("touchend", (event) => {
      const end = event.changedTouches[0];
      if (start !== null && Math.abs(end.clientX - start.clientX) > 60 &&
          Math.abs(end.clientY - start.clientY) < 60) {
        this.step(end.clientX < start.clientX ? "older" : "newer");
      }
      start = null;
    }, { passive: true });
  }
}

function isPlainClick(event) {
  return event.button === 0 && !event.ctrlKey && !event.metaKey && !event.shiftKey && !event.altKey;
}

// The photo that the address of the page names; null if it names none.
function photoOfLocation() {
  return /^\/photos\/(-?\d+)$/.exec(location.pathname)?.[1] ?? null;
}

// Opens the photos of a grid in a dialog. The address is that of the photo meanwhile.
function openInDialog(grid) {
  const dialog = document.createElement("dialog");
  dialog.className = "overlay";
  dialog.setAttribute("aria-labelledby", "photo-name");
  dialog.append(cloneOf("viewer"));
  document.body.append(dialog);
  const viewer = new Viewer(dialog.querySelector("article"), grid.query);
  const title = document.title;

  const open = (id) => {
    viewer.show(id);
    if (!dialog.open) {
      dialog.showModal();
      dialog.querySelector(".close").focus();
    }
  };
  const close = () => {
    if (history.state?.isDialog) {
      history.back();
    } else {
      dialog.close();
    }
  };
  grid.root.addEventListener("click", (event) => {
    const tile = event.target.closest("li[data-id]");
    if (tile !== null && isPlainClick(event)) {
      event.preventDefault();
      history.pushState({ isDialog: true }, "", tile.querySelector("a").href);
      open(tile.dataset.id);
    }
  });
  addEventListener("popstate", () => {
    const id = photoOfLocation();
    if (id !== null) {
      open(id);
    } else if (dialog.open) {
      dialog.close();
    }
  });
  dialog.addEventListener("close", () => {
    document.title = title;
    viewer.image.removeAttribute("src");
    grid.focus(viewer.id);
    viewer.id = null;
  });
  dialog.addEventListener("cancel", (event) => {
    event.preventDefault();
    close();
  });
  dialog.addEventListener("keydown", (event) => viewer.press(event));
  dialog.querySelector(".close").addEventListener("click", (event) => {
    event.preventDefault();
    close();
  });
  return viewer;
}

// The page of one photo: the keys lead to its neighbours and back to the list.
function followKeys(article) {
  const viewer = new Viewer(article, location.search);
  viewer.take(photoOfLocation());
  addEventListener("keydown", (event) => {
    if (!viewer.press(event) && event.key === "Escape" && !event.target.matches("input")) {
      location.assign(article.querySelector(".close").href);
    }
  });
  return viewer;
}

// A list of folders, whose folders open in place.
class Tree {
  constructor(list) {
    this.list = list;
    for (const item of list.children) {
      this.addButton(item);
    }
  }

  // The top of the tree is a single folder.
  openOnly() {
    if (this.list.children.length === 1) {
      this.list.querySelector(".toggle")?.click();
    }
  }

  addButton(item) {
    if (!("folders" in item.dataset)) {
      return;
    }
    const button = document.createElement("button");
    button.type = "button";
    button.className = "toggle";
    button.setAttribute("aria-expanded", "false");
    button.setAttribute("aria-label", `Folders in ${item.querySelector("bdi").textContent}`);
    button.addEventListener("click", () => this.toggle(item, button));
    item.prepend(button);
  }

  async toggle(item, button) {
    const isOpen = button.getAttribute("aria-expanded") === "true";
    button.setAttribute("aria-expanded", String(!isOpen));
    let list = item.querySelector("ul");
    if (list === null && !isOpen) {
      list = document.createElement("ul");
      item.append(list);
      try {
        await this.fill(list, item.dataset.id, "");
      } catch {
        list.remove(); // the next click tries again
        button.setAttribute("aria-expanded", "false");
        return;
      }
    }
    if (list !== null) {
      list.hidden = button.getAttribute("aria-expanded") === "false";
    }
  }

  async fill(list, parent, after) {
    const answer = await fetchJson(`/api/folders?parent=${parent}&count=${COUNT}${after}`);
    for (const folder of answer.folders) {
      const item = cloneOf("folder");
      item.dataset.id = folder.id;
      if (folder.has_folders) {
        item.dataset.folders = "";
      }
      item.querySelector("a").href = `/folders/${folder.id}`;
      item.querySelector("bdi").textContent = shown(lastComponent(folder.path));
      this.addButton(item);
      list.append(item);
    }
    if (answer.more && answer.folders.length > 0) {
      const rest = document.createElement("li");
      const button = document.createElement("button");
      button.type = "button";
      button.className = "button";
      button.textContent = "More folders";
      button.addEventListener("click", () => {
        this.fill(list, parent, `&after=${answer.folders.at(-1).id}`)
          .then(() => rest.remove(), () => {}); // the next click tries again
      });
      rest.append(button);
      list.append(rest);
    }
  }
}

// Shows how far a volume is, in a card or in the strip above the newest photos.
function fillVolume(item, volume) {
  const set = (selector, text) => {
    const element = item.querySelector(selector);
    if (element !== null && element.textContent !== text) {
      element.textContent = text;
    }
  };
  const total = Math.max(volume.total, 0);
  const done = Math.min(Math.max(volume.transcoded, 0), total);
  item.dataset.volume = shown(volume.volume);
  item.classList.toggle("gone", volume.gone);
  item.querySelector("progress").max = Math.max(total, 1);
  item.querySelector("progress").value = done;
  set(".name bdi", shown(lastComponent(volume.volume)));
  set(".percent", volume.gone ? "gone" : total === 0 ? "" : `${Math.floor((done * 100) / total)} %`);
  set(".place bdi", shown(volume.volume));
  set(".transcoded", grouped(volume.transcoded));
  set(".total", grouped(volume.total));
  for (const name of ["waiting", "failed"]) {
    set(`.${name} b`, grouped(volume[name] ?? 0));
    item.querySelector(`.${name}`)?.toggleAttribute("hidden", !(volume[name] > 0));
  }
  set(".activity", volume.activity);
  set(".merged b", volume.local_merged_up_to ?? "-");
}

function updateVolumes(list, volumes) {
  // Several may have the same name here, where it is not UTF-8.
  const items = [...list.children].filter((item) => "volume" in item.dataset);
  const strip = list.closest(".strip");
  let place = list.firstElementChild;
  for (const volume of strip === null ? volumes : volumes.slice(0, MOST_IN_STRIP)) {
    const name = shown(volume.volume);
    const at = items.findIndex((other) => other.dataset.volume === name);
    let item = items[at];
    if (at >= 0) {
      items.splice(at, 1);
    } else {
      item = cloneOf("volume");
      item.querySelector(".volume-link").href = volumeAddress(volume.volume);
    }
    fillVolume(item, volume);
    if (item === place) {
      place = place.nextElementSibling;
    } else {
      list.insertBefore(item, place);
    }
  }
  for (const item of items) {
    item.remove();
  }
  strip?.toggleAttribute("hidden", list.children.length === 0);
}

// What the page says when it has nothing to show.
async function updateEmpty(status, volumes, grid, list) {
  const empty = document.getElementById("empty");
  if (empty === null) {
    return;
  }
  const isPreparing = volumes.some((volume) =>
    !volume.gone && (volume.total > 0 || volume.waiting > 0));
  const kind = status.state === "building" ? "building" : isPreparing ? "preparing" : "none";
  const hasItems = async () => location.pathname === "/search"
    ? (await fetchJson("/api/months")).months.length > 0
    : (await fetchJson("/api/folders?count=1")).folders.length > 0;
  if (grid !== null) {
    empty.hidden = grid.photos.length > 0;
  } else if (list !== null) {
    empty.hidden = list.children.length > 0;
  } else if (await hasItems()) {
    location.reload();
  }
  if (!empty.hidden && kind !== empty.dataset.kind) {
    location.reload();
  }
}

function updateNotice(status) {
  const notice = document.getElementById("notice");
  const text = {
    building: status.total > 0
      ? `The list of photos is being built: ${grouped(status.done)} of about ${grouped(status.total)}.`
      : "The list of photos is being built.",
    failed: "The merged database cannot be read, so this page may be out of date: " +
      shown(status.reason),
    no_database: status.reason === ""
      ? "There is no merged database at the moment."
      : shown(status.reason),
  }[status.state];
  if (notice.textContent !== (text ?? "")) {
    const paragraph = document.createElement("p");
    paragraph.textContent = text;
    notice.replaceChildren(...(text === undefined ? [] : [paragraph]));
  }
  notice.dataset.state = status.state;
}

// Follows the changes of the photos and the volumes while the page can be seen. A hidden page needs
// no connection, of which browsers have only a few.
function follow(grid, viewer) {
  const list = document.querySelector(".strip ul, ul.volumes");
  let source = null;
  let arePhotosDue = false;
  let timer = null; // of the next update
  let planned = Infinity; // when it ends
  let last = 0;
  let pause = FIRST_PAUSE;

  const update = async () => {
    planned = Infinity;
    last = performance.now();
    const withPhotos = arePhotosDue;
    arePhotosDue = false;
    try {
      const status = await fetchJson("/api/status");
      const { volumes } = await fetchJson("/api/volumes");
      updateNotice(status);
      if (list !== null) {
        updateVolumes(list, volumes);
      }
      if (withPhotos && grid !== null && !await grid.refresh()) {
        throw new Error("photos are missing");
      }
      if (withPhotos) {
        await viewer?.refresh();
      }
      await updateEmpty(status, volumes, grid, list);
      pause = FIRST_PAUSE;
      if (status.state === "building") {
        plan(true);
      }
    } catch {
      retry(withPhotos);
      pause = Math.min(2 * pause, LONGEST_PAUSE);
    }
  };
  const plan = (withPhotos, time = last + CALM) => {
    arePhotosDue ||= withPhotos;
    if (!document.hidden && time < planned) {
      clearTimeout(timer);
      planned = time;
      timer = setTimeout(update, Math.max(0, time - performance.now()));
    }
  };
  // The stream of events stays open when only a request fails, so the server sends no event then.
  const retry = (withPhotos) => plan(withPhotos, performance.now() + pause);
  const connect = () => {
    if (document.hidden) {
      source?.close();
      source = null;
      clearTimeout(timer);
      planned = Infinity;
    } else if (source === null) {
      source = new EventSource("/api/events");
      source.addEventListener("change", () => plan(true));
      source.addEventListener("volumes", () => plan(false));
      source.addEventListener("error", () => {
        // The browser connects again after a lost connection, but not after a refused one.
        if (source?.readyState === EventSource.CLOSED) {
          source = null;
          setTimeout(connect, RETRY);
        }
      });
    }
  };
  for (const part of [grid, viewer]) {
    if (part !== null) {
      part.onFailure = () => retry(true);
    }
  }
  document.addEventListener("visibilitychange", connect);
  // A page in the browser's cache of pages has no connection either.
  addEventListener("pagehide", () => {
    source?.close();
    source = null;
  });
  addEventListener("pageshow", connect);
  connect();
}

function start() {
  const photos = document.querySelector(".photos");
  const grid = photos === null ? null : new Grid(photos);
  const article = document.querySelector("main > article.viewer");
  const viewer = grid !== null ? openInDialog(grid) : article !== null ? followKeys(article) : null;
  const tree = document.querySelector(".tree > ul");
  if (tree !== null) {
    new Tree(tree).openOnly();
  }
  addEventListener("keydown", (event) => {
    if (event.key === "/" && !event.target.matches("input, select")) {
      event.preventDefault();
      document.querySelector("input[type=search]")?.focus();
    }
  });
  // Capture: the error of an image does not bubble.
  document.addEventListener("error", (event) => {
    if (event.target.matches?.(".grid img")) {
      event.target.closest("li").classList.add("missing");
    }
  }, true);
  follow(grid, viewer);
}

start();
